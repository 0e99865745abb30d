// Units of the keys that quorlet itself measures.
#ifndef QUORLET_CTL_EXPORT_UNITS_H_
#define QUORLET_CTL_EXPORT_UNITS_H_

#include <string_view>

namespace quorlet {

// The unit as UCUM writes it ("By", "MiBy", "min"; "1" for a plain count or ratio). Empty for a key
// of others, and for one of ours whose unit the device alone knows.
std::string_view UnitOfKey(std::string_view key);

}  // namespace quorlet

#endif  // QUORLET_CTL_EXPORT_UNITS_H_
