// Preferences in memory.
#ifndef QUORLET_TESTS_FAKES_FAKE_PREFERENCES_H_
#define QUORLET_TESTS_FAKES_FAKE_PREFERENCES_H_

#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "platform/preferences.h"
#include "platform/system_log.h"

namespace quorlet {

class FakePreferences : public Preferences {
 public:
  using Domain = std::map<std::string, PropertyValue, std::less<>>;
  // What is durable, by domain; it outlives the process.
  using Disk = std::map<std::string, Domain, std::less<>>;

  // A process on a disk of its own; refused domain names leave their error line in `log`.
  explicit FakePreferences(SystemLog* log = nullptr) : log_(log) {}
  // One of several processes on a disk.
  FakePreferences(std::shared_ptr<Disk> disk, SystemLog* log) : disk_(std::move(disk)), log_(log) {}
  ~FakePreferences() override {
    for (const auto& [domain, changes] : pending_) flush(domain);
  }

  std::optional<PropertyValue> DGWPreferencesGetValue(std::string_view key,
                                                      std::string_view domain) override {
    if (isRefused(domain)) return std::nullopt;
    const auto& changes = pending_[std::string(domain)];
    const auto change = changes.find(key);
    auto value = change != changes.end() ? change->second : durable(key, domain);
    return value ? std::optional(value->deepCopy()) : std::nullopt;
  }

  void DGWPreferencesSetValue(std::string_view key, std::optional<PropertyValue> value,
                              std::string_view domain) override {
    if (beforeChange) beforeChange();
    if (isRefused(domain)) return;
    if (value) value = value->deepCopy();
    pending_[std::string(domain)].insert_or_assign(std::string(key), std::move(value));
  }

  bool DGWPreferencesSynchronize(std::string_view domain) override {
    if (beforeChange) beforeChange();
    if (isRefused(domain)) return true;
    synchronized.emplace_back(domain);
    if (full.contains(domain)) return false;
    flush(domain);
    return true;
  }

  void addToInteger(std::string_view key, std::int64_t delta, std::string_view domain) override {
    const auto value = DGWPreferencesGetValue(key, domain);
    if (delta == 0 || (!value && delta < 0)) return;
    const std::int64_t sum = DGWPreferencesGetIntegerValue(key, domain) + delta;
    DGWPreferencesSetValue(key, Int64(sum < 0 ? 0 : sum), domain);
  }

  bool isReadable(std::string_view domain) override { return !unreadable.contains(domain); }

  // The process dies: what is not durable is gone.
  void crash() { pending_.clear(); }
  const Disk& disk() const { return *disk_; }

  // Whether the key reads the same after a crash as it does now.
  bool isDurable(std::string_view key, std::string_view domain) {
    return DGWPreferencesGetValue(key, domain) == durable(key, domain);
  }

  std::vector<std::string> synchronized;    // every domain, in order
  std::function<void()> beforeChange;       // may throw: the change is not made
  std::set<std::string, std::less<>> full;  // domains that cannot be written just now
  std::set<std::string, std::less<>> unreadable;

 private:
  using Changes = std::map<std::string, std::optional<PropertyValue>, std::less<>>;

  bool isRefused(std::string_view domain) {
    const bool refused = domain.empty() || domain.size() > 200 || domain.front() == '.' ||
                         domain.find_first_of(std::string_view("/\n\0", 3)) != domain.npos;
    if (refused && refused_.emplace(domain).second && log_ != nullptr) {
      log_->error("Refused the preference domain %@", domain);
    }
    return refused;
  }

  std::optional<PropertyValue> durable(std::string_view key, std::string_view domain) const {
    const auto found = disk_->find(domain);
    if (found == disk_->end()) return std::nullopt;
    const auto entry = found->second.find(key);
    return entry != found->second.end() ? std::optional(entry->second) : std::nullopt;
  }

  void flush(std::string_view domain) {
    Changes& changes = pending_[std::string(domain)];
    Domain& stored = (*disk_)[std::string(domain)];
    for (auto& [key, value] : changes) {
      if (value) {
        stored.insert_or_assign(key, *value);
      } else {
        stored.erase(key);
      }
    }
    changes.clear();
  }

  std::shared_ptr<Disk> disk_ = std::make_shared<Disk>();
  std::set<std::string> refused_;
  SystemLog* log_;
  std::map<std::string, Changes, std::less<>> pending_;
};

}  // namespace quorlet

#endif  // QUORLET_TESTS_FAKES_FAKE_PREFERENCES_H_
