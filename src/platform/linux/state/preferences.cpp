// Preferences in property-list files, one for each domain.
//
// A domain's file is read when it is first asked for and again whenever it has changed; the changes
// of this process that are not yet durable lie over it. Synchronizing takes the domain's lock file,
// reads the file as it is then, and writes it whole with only this process's changes merged in.
#include "platform/preferences.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <exception>
#include <limits>
#include <map>
#include <mutex>
#include <set>
#include <string>
#include <utility>
#include <variant>

#include "platform/linux/base/paths.h"
#include "platform/linux/state/services.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

constexpr std::size_t kLongestShownName = 201;  // a byte more than a good name has

// Tells whether a file has changed since it was read; `error` when it cannot be examined.
struct FileVersion {
  dev_t device = 0;
  ino_t inode = 0;
  off_t size = 0;
  std::int64_t modified = 0;  // nanoseconds
  std::int64_t changed = 0;
  int error = 0;
  bool operator==(const FileVersion&) const = default;
};

std::int64_t Nanoseconds(const timespec& time) {
  return static_cast<std::int64_t>(time.tv_sec) * 1'000'000'000 + time.tv_nsec;
}

FileVersion VersionOf(const std::string& path) {
  struct stat status = {};
  FileVersion version;
  if (stat(path.c_str(), &status) != 0) {
    version.error = errno;
    return version;
  }
  version.device = status.st_dev;
  version.inode = status.st_ino;
  version.size = status.st_size;
  version.modified = Nanoseconds(status.st_mtim);
  version.changed = Nanoseconds(status.st_ctim);
  return version;
}

// Why a domain's file gives no dictionary.
struct ReadFailure {
  std::string why;
  bool isDamage;  // its bytes were read, and are no dictionary; otherwise they could not be read
};

std::variant<Dictionary, ReadFailure> ReadDomainFile(const std::string& path) {
  const auto bytes = ReadOwnFile(path, kMaxPropertyListBytes);
  if (const int* error = std::get_if<int>(&bytes)) return ReadFailure{ErrnoText(*error), false};
  auto document = ReadPropertyList(std::string_view(std::get<std::string>(bytes)));
  if (const auto* error = std::get_if<PropertyListError>(&document)) {
    return ReadFailure{error->description, true};
  }
  const Dictionary* dictionary = std::get<PropertyValue>(document).asDictionary();
  if (dictionary == nullptr) return ReadFailure{"it holds no dictionary", true};
  return *dictionary;
}

// Nothing where the change comes to nothing.
std::optional<std::int64_t> Added(const PropertyValue* value, std::int64_t delta) {
  const Number* number = value != nullptr ? value->asNumber() : nullptr;
  if (delta == 0 || (number == nullptr && delta < 0)) return std::nullopt;
  std::int64_t sum = 0;
  if (__builtin_add_overflow(number != nullptr ? number->toInt64() : 0, delta, &sum)) {
    sum = delta > 0 ? std::numeric_limits<std::int64_t>::max() : 0;
  }
  return std::max<std::int64_t>(sum, 0);
}

// The document, or why it cannot be written. One that could not be read again is not written.
std::variant<std::string, PropertyListError> Document(const PropertyValue& value) {
  auto document = WriteXmlPropertyList(value);
  const std::string* text = std::get_if<std::string>(&document);
  if (text == nullptr || text->size() <= kMaxPropertyListBytes) return document;
  return PropertyListError{"the document would be too large"};
}

// Whether both look the same in a file; 5 and 5.0 do not, although they are equal.
bool IsWrittenAlike(const PropertyValue& one, const PropertyValue& other) {
  // Spares most changes the documents. What only repair makes alike is written once more.
  if (!(one == other)) return false;
  const auto oneDocument = Document(one);
  const auto otherDocument = Document(other);
  const auto* oneText = std::get_if<std::string>(&oneDocument);
  const auto* otherText = std::get_if<std::string>(&otherDocument);
  return oneText != nullptr && otherText != nullptr && *oneText == *otherText;
}

// `key` as it will read after it was written to a file, so that a change is found under the same
// key before and after.
std::string StorableKey(std::string_view key) {
  const auto isPlain = [](char c) { return c >= 0x20 && c < 0x7f; };
  if (!key.empty() && std::ranges::all_of(key, isPlain)) return std::string(key);
  const auto document = WriteXmlPropertyList(Dictionary{{key, true}});
  const auto* text = std::get_if<std::string>(&document);
  if (text == nullptr) return std::string(key);
  const auto reread = ReadPropertyList(std::string_view(*text));
  const auto* value = std::get_if<PropertyValue>(&reread);
  const Dictionary* dictionary = value != nullptr ? value->asDictionary() : nullptr;
  if (dictionary == nullptr || dictionary->empty()) return std::string(key);
  return dictionary->begin()->first;
}

class LinuxPreferences : public Preferences {
 public:
  LinuxPreferences(const Root& root, Access access, SystemLog& log)
      : directory_(root.path(kPreferencesDirectory)), access_(access), log_(log) {}

  ~LinuxPreferences() override {
    for (auto& [name, domain] : domains_) {
      try {
        synchronize(name, domain);
      } catch (const std::exception&) {
        // Out of memory; the process ends all the same.
      }
    }
  }

  std::optional<PropertyValue> DGWPreferencesGetValue(std::string_view key,
                                                      std::string_view domain) override {
    const std::lock_guard lock(mutex_);
    Domain* found = findDomain(domain);
    if (found == nullptr) return std::nullopt;
    const std::string stored = StorableKey(key);
    if (const auto change = found->pending.find(stored); change != found->pending.end()) {
      return change->second;
    }
    refresh(domain, *found);
    const PropertyValue* value = found->stored.find(stored);
    if (const auto added = found->added.find(stored); added != found->added.end()) {
      if (const auto sum = Added(value, added->second)) return Int64(*sum);
    }
    return value != nullptr ? std::optional(*value) : std::nullopt;
  }

  void addToInteger(std::string_view key, std::int64_t delta, std::string_view domain) override {
    const std::lock_guard lock(mutex_);
    Domain* found = findDomain(domain);
    if (found == nullptr) return;
    const std::string stored = StorableKey(key);
    if (const auto change = found->pending.find(stored); change != found->pending.end()) {
      const PropertyValue* value = change->second ? &*change->second : nullptr;
      if (const auto sum = Added(value, delta)) change->second = Int64(*sum);
      return;
    }
    std::int64_t& added = found->added[stored];
    if (__builtin_add_overflow(added, delta, &added)) {
      added = delta > 0 ? std::numeric_limits<std::int64_t>::max()
                        : std::numeric_limits<std::int64_t>::min();
    }
    if (added == 0) found->added.erase(stored);
  }

  bool isReadable(std::string_view domain) override {
    const std::lock_guard lock(mutex_);
    Domain* found = findDomain(domain);
    if (found == nullptr) return false;
    refresh(domain, *found);
    return !found->unreadable;
  }

  void DGWPreferencesSetValue(std::string_view key, std::optional<PropertyValue> value,
                              std::string_view domain) override {
    const std::lock_guard lock(mutex_);
    Domain* found = findDomain(domain);
    if (found == nullptr) return;
    found->hasFailed = false;
    const std::string stored = StorableKey(key);
    found->added.erase(stored);
    found->pending.insert_or_assign(stored, std::move(value));
  }

  bool DGWPreferencesSynchronize(std::string_view domain) override {
    const std::lock_guard lock(mutex_);
    Domain* found = findDomain(domain);
    return found == nullptr || synchronize(domain, *found);
  }

 private:
  using Changes = std::map<std::string, std::optional<PropertyValue>, std::less<>>;

  struct Domain {
    std::optional<FileVersion> version;  // of `stored`; none before the first reading
    Dictionary stored;
    bool damaged = false;     // there is a file, but `stored` is not from it
    bool unreadable = false;  // nor can it be known what the file holds
    Changes pending;          // no value: the key is to be removed
    std::map<std::string, std::int64_t, std::less<>> added;  // to the value that the file holds
    bool hasFailed = false;  // the pending changes could not be written, and that was said
  };

  // The domain's state, or nullptr and an error line for a name that is refused.
  Domain* findDomain(std::string_view name) {
    if (const auto found = domains_.find(name); found != domains_.end()) return &found->second;
    if (!IsSafeName(name)) {
      refuse(name);
      return nullptr;
    }
    return &domains_[std::string(name)];
  }

  // Says so once for each name: tasking, say, may come back to one several times.
  void refuse(std::string_view name) {
    constexpr std::size_t kMostRemembered = 1000;
    const std::string shown(name.substr(0, kLongestShownName));
    if (refused_.size() < kMostRemembered ? refused_.insert(shown).second
                                          : !refused_.contains(shown)) {
      log_.error("Refused the preference domain name \"%@\"", shown);
    }
  }

  std::string path(std::string_view domain) const {
    return directory_ + "/" + std::string(domain) + ".plist";
  }

  // Reads the domain's file when it is not the one that was read last.
  void refresh(std::string_view name, Domain& domain) {
    // Taken before the file is read: a change in between only leads to one more reading.
    const FileVersion version = VersionOf(path(name));
    if (domain.version == version) return;
    const bool wasUnreadable = std::exchange(domain.unreadable, false);
    domain.version = version;
    domain.stored = Dictionary();
    domain.damaged = false;
    if (version.error == ENOENT) return;
    auto read = ReadDomainFile(path(name));
    if (const auto* dictionary = std::get_if<Dictionary>(&read)) {
      domain.stored = *dictionary;
      return;
    }
    const ReadFailure& failure = std::get<ReadFailure>(read);
    domain.damaged = failure.isDamage;
    domain.unreadable = !failure.isDamage;
    // What could not be read just now may be readable a moment later.
    if (domain.unreadable) domain.version.reset();
    if (domain.unreadable && wasUnreadable) return;
    log_.error("Cannot read the preferences %@, taking them as empty: %@", path(name), failure.why);
  }

  // As DGWPreferencesSynchronize. What fails again is not said again.
  bool synchronize(std::string_view name, Domain& domain) {
    domain.hasFailed = !write(name, domain);
    return !domain.hasFailed;
  }

  bool write(std::string_view name, Domain& domain) {
    if (access_ == Access::kReadOnly) return true;
    if (isSettled(name, domain)) return true;  // nothing to write: no lock file either
    const std::string lockPath = directory_ + "/." + std::string(name) + ".lock";
    const FileLock lock(lockPath);
    if (lock.error() != 0) {
      if (!domain.hasFailed) {
        log_.error("Cannot lock the preferences %@ by %@: %@", path(name), lockPath,
                   ErrnoText(lock.error()));
      }
      return false;
    }
    if (isSettled(name, domain)) return true;
    return !domain.unreadable && writeMerged(name, domain);
  }

  // Drops the pending changes when the file already holds them all.
  bool isSettled(std::string_view name, Domain& domain) {
    if (domain.pending.empty() && domain.added.empty()) return true;
    refresh(name, domain);
    if (domain.unreadable) return false;
    std::erase_if(domain.added, [&](const auto& change) {
      return !Added(domain.stored.find(change.first), change.second);
    });
    const bool settled =
        domain.added.empty() && std::ranges::all_of(domain.pending, [&](const auto& change) {
          const PropertyValue* stored = domain.stored.find(change.first);
          if (stored == nullptr || !change.second) return stored == nullptr && !change.second;
          return IsWrittenAlike(*stored, *change.second);
        });
    if (settled) domain.pending.clear();
    return settled;
  }

  // What the file would hold with the pending changes, but for those in `refused`.
  static Dictionary merge(const Domain& domain, const Changes& refused) {
    Dictionary merged = domain.stored.shallowCopy();
    for (const auto& [key, value] : domain.pending) {
      if (refused.contains(key)) continue;
      if (value) {
        merged[key] = *value;
      } else {
        merged.remove(key);
      }
    }
    for (const auto& [key, delta] : domain.added) {
      if (const auto sum = Added(merged.find(key), delta)) merged[key] = Int64(*sum);
    }
    return merged;
  }

  // The pending changes that no file can hold, which must not keep the others out of it.
  Changes findUnwritable(std::string_view name, const Domain& domain) {
    Changes refused;
    for (const auto& [key, value] : domain.pending) {
      if (!value) continue;
      const auto alone = Document(Dictionary{{key, *value}});
      if (const auto* error = std::get_if<PropertyListError>(&alone)) {
        log_.error("Cannot write the preference %@ of %@: %@", key, name, error->description);
        refused.emplace(key, value);
      }
    }
    return refused;
  }

  // Replaces the file by what it holds with the pending changes merged in. With the lock held.
  bool writeMerged(std::string_view name, Domain& domain) {
    Changes refused;
    auto document = Document(merge(domain, refused));
    if (std::holds_alternative<PropertyListError>(document)) {
      refused = findUnwritable(name, domain);
      if (refused.size() == domain.pending.size() && domain.added.empty()) return true;
      if (!refused.empty()) document = Document(merge(domain, refused));
    }
    if (const auto* error = std::get_if<PropertyListError>(&document)) {
      log_.error("Cannot write the preferences %@: %@", path(name), error->description);
      return true;
    }
    if (const int error = replaceFile(name, domain.damaged, std::get<std::string>(document))) {
      if (!domain.hasFailed) {
        log_.error("Cannot write the preferences %@: %@", path(name), ErrnoText(error));
      }
      return false;
    }
    domain.pending = std::move(refused);
    domain.added.clear();
    domain.version.reset();  // values read back as the file holds them
    return true;
  }

  int replaceFile(std::string_view name, bool keepDamaged, const std::string& document) {
    AtomicFile file(directory_, name);
    if (const int error = file.open()) return error;
    if (const int error = file.write(document)) return error;
    // Only now, so that a full disk leaves the damaged file where it is.
    std::string aside;
    if (keepDamaged) {
      if (const int error = MoveAsideAsDamaged(path(name), aside)) return error;
    }
    return file.publish(std::string(name) + ".plist");
  }

  const std::string directory_;
  const Access access_;
  SystemLog& log_;
  std::mutex mutex_;
  std::map<std::string, Domain, std::less<>> domains_;
  std::set<std::string> refused_;
};

}  // namespace

std::unique_ptr<Preferences> MakeLinuxPreferences(const Root& root, Access access, SystemLog& log) {
  return std::make_unique<LinuxPreferences>(root, access, log);
}

}  // namespace quorlet
