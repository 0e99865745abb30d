// Whitelist documents for tests.
#ifndef QUORLET_TESTS_FAKES_WHITELIST_H_
#define QUORLET_TESTS_FAKES_WHITELIST_H_

#include <initializer_list>
#include <string>

namespace quorlet {

inline std::string Plist(const std::string& root) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">" + root +
         "</plist>\n";
}

// A key with one integer option, or with none when `option` is empty.
struct WhitelistKey {
  std::string key;
  std::string option;
  std::string value;
};

// One key group with one table.
inline std::string Group(const std::string& name, const std::string& table,
                         std::initializer_list<WhitelistKey> keys) {
  std::string text = "<key>" + name + "</key><dict><key>" + table + "</key><dict>";
  for (const WhitelistKey& key : keys) {
    text += "<key>" + key.key + "</key><dict>";
    if (!key.option.empty()) {
      text += "<key>" + key.option + "</key><integer>" + key.value + "</integer>";
    }
    text += "</dict>";
  }
  return text + "</dict></dict>";
}

}  // namespace quorlet

#endif  // QUORLET_TESTS_FAKES_WHITELIST_H_
