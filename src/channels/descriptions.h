// Texts of channels and samples, as the library prints them.
#ifndef QUORLET_CHANNELS_DESCRIPTIONS_H_
#define QUORLET_CHANNELS_DESCRIPTIONS_H_

#include <optional>
#include <string>
#include <string_view>

namespace quorlet {

// The text as UTF-8; nothing for an empty or an ill-formed one.
std::optional<std::string> _copyUTF8String(std::string_view text);

}  // namespace quorlet

#endif  // QUORLET_CHANNELS_DESCRIPTIONS_H_
