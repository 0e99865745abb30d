// The crash-reporting support library as a library that is loaded and searched by name at run time.
#ifndef QUORLET_PLATFORM_SUPPORT_LIBRARY_H_
#define QUORLET_PLATFORM_SUPPORT_LIBRARY_H_

#include <cstdint>
#include <string_view>

namespace quorlet {

class Preferences;

// What the looked-up functions are. They work on the preferences that they are given, so what they
// write is seen by the rest of the process.
using IntegerPreferenceReader = std::int64_t (*)(Preferences& preferences, const char* key,
                                                 const char* domain);
using IntegerPreferenceWriter = void (*)(Preferences& preferences, const char* key,
                                         std::int64_t value, const char* domain);

class SupportLibrary {
 public:
  // Any function; the caller casts it back to the type that the name stands for.
  using Function = void (*)();

  // What users of the library have bound so far, for the life of the process; never cleared.
  IntegerPreferenceReader integerReader = nullptr;
  IntegerPreferenceWriter integerWriter = nullptr;

  virtual ~SupportLibrary() = default;

  // Loads the library; it stays loaded, and loading it again is harmless. False on failure.
  virtual bool load() = 0;

  // The function exported as `name`, or nullptr. Only after a successful load().
  virtual Function findFunction(const char* name) = 0;
};

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_SUPPORT_LIBRARY_H_
