// The support library is the program itself: its functions are linked in, exported, and looked up
// by name at run time. The link options beside this file keep them in every program.
#include "platform/support_library.h"

#include <dlfcn.h>

#include <type_traits>

#include "platform/linux/device/services.h"
#include "platform/preferences.h"

extern "C" {

[[gnu::visibility("default")]] std::int64_t DGWPreferencesGetIntegerValue(
    quorlet::Preferences& preferences, const char* key, const char* domain);
[[gnu::visibility("default")]] void DGWPreferencesSetValue(quorlet::Preferences& preferences,
                                                           const char* key, std::int64_t value,
                                                           const char* domain);

std::int64_t DGWPreferencesGetIntegerValue(quorlet::Preferences& preferences, const char* key,
                                           const char* domain) {
  return preferences.DGWPreferencesGetIntegerValue(key, domain);
}

void DGWPreferencesSetValue(quorlet::Preferences& preferences, const char* key, std::int64_t value,
                            const char* domain) {
  // As a change of what was read, so that what another process counts meanwhile is not lost.
  const std::int64_t read = preferences.DGWPreferencesGetIntegerValue(key, domain);
  std::int64_t change = 0;
  if (__builtin_sub_overflow(value, read, &change)) return;
  preferences.addToInteger(key, change, domain);
}

}  // extern "C"

namespace quorlet {
namespace {

// A mismatch would be a call through the wrong type, which nothing else would notice.
static_assert(std::is_same_v<decltype(&::DGWPreferencesGetIntegerValue), IntegerPreferenceReader>);
static_assert(std::is_same_v<decltype(&::DGWPreferencesSetValue), IntegerPreferenceWriter>);

class LinuxSupportLibrary : public SupportLibrary {
 public:
  bool load() override {
    if (library_ == nullptr) library_ = dlopen(nullptr, RTLD_LAZY | RTLD_LOCAL);
    return library_ != nullptr;
  }

  Function findFunction(const char* name) override {
    return library_ == nullptr ? nullptr : reinterpret_cast<Function>(dlsym(library_, name));
  }

 private:
  void* library_ = nullptr;  // never closed: functions found in it may be called at any time
};

}  // namespace

std::unique_ptr<SupportLibrary> MakeLinuxSupportLibrary() {
  return std::make_unique<LinuxSupportLibrary>();
}

}  // namespace quorlet
