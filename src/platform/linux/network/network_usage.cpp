#include "platform/linux/network/network_usage.h"

#include <algorithm>
#include <chrono>
#include <exception>
#include <future>
#include <mutex>
#include <optional>
#include <system_error>
#include <utility>

#include "platform/linux/base/semaphores.h"
#include "platform/linux/network/unit_usage.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

constexpr char kRecordsPath[] = "/var/db/vigil/usage.plist";
constexpr std::chrono::milliseconds kUnitUsageLimit(100);
constexpr double kMaxDelaySeconds = 30.0 * 86400;

struct Answer {
  std::chrono::nanoseconds delay{0};
  std::optional<Array> records;  // none when they cannot be had
};

class LinuxNetworkUsage : public NetworkUsage {
 public:
  LinuxNetworkUsage(const Root& root, SystemLog& log)
      : root_(root), log_(log), stop_(MakeLinuxSemaphores()->create()) {}

  ~LinuxNetworkUsage() override {
    for (std::size_t i = 0; i < queries_.size(); ++i) stop_->signal();
    queries_.clear();  // waits for each
  }

  void QueryProcessDataUsage(const std::vector<std::string>& nameFilter, UsageNameKind kind,
                             Reply reply) override {
    const std::lock_guard lock(mutex_);
    std::erase_if(queries_, [](const std::future<void>& query) {
      return query.wait_for(std::chrono::seconds(0)) == std::future_status::ready;
    });
    auto run = [this, nameFilter, kind, mine = std::move(reply)]() mutable {
      // What the reply holds on to is given up when it is done, not with the query.
      const Reply once = std::exchange(mine, nullptr);
      answer(nameFilter, kind, once);
    };
    try {
      queries_.push_back(std::async(std::launch::async, std::move(run)));
    } catch (const std::system_error& error) {
      log_.error("Cannot start a network usage query: %@", error.what());
    }
  }

 private:
  void answer(const std::vector<std::string>& nameFilter, UsageNameKind kind, const Reply& reply) {
    try {
      const auto start = std::chrono::steady_clock::now();
      Answer answer = readAnswer();
      if (answer.records && !nameFilter.empty()) {
        answer.records = Named(*answer.records, nameFilter, kind);
      }
      const auto used = std::chrono::steady_clock::now() - start;
      if (stop_->wait(std::max(answer.delay - used, std::chrono::nanoseconds(0)))) return;
      reply(answer.records ? &*answer.records : nullptr);
    } catch (const std::exception& error) {
      log_.error("A network usage reply failed: %@", error.what());
    } catch (...) {
      log_.error("A network usage reply failed");
    }
  }

  static Array Named(const Array& records, const std::vector<std::string>& names,
                     UsageNameKind kind) {
    Array chosen;
    for (const PropertyValue& record : records) {
      const Dictionary* entries = record.asDictionary();
      const std::string* name = nullptr;
      switch (kind) {
        case UsageNameKind::kProcessName:
          name = entries != nullptr ? StringEntry(*entries, "procName") : nullptr;
      }
      if (name != nullptr && std::ranges::find(names, *name) != names.end()) {
        chosen.push_back(record);
      }
    }
    return chosen;
  }

  Answer readAnswer() {
    const std::string path = root_.path(kRecordsPath);
    const auto bytes = ReadWholeFile(path, kMaxPropertyListBytes);
    if (const int* error = std::get_if<int>(&bytes)) {
      if (*error == ENOENT) return readUnits();
      log_.error("Cannot read %@: %@", path, ErrnoText(*error));
      return {};
    }
    const auto document = ReadPropertyList(std::string_view(std::get<std::string>(bytes)));
    if (const auto* error = std::get_if<PropertyListError>(&document)) {
      log_.error("Cannot read %@: %@", path, error->description);
      return {};
    }
    const auto& value = std::get<PropertyValue>(document);
    if (const Array* records = value.asArray()) return {.records = *records};
    return readDelayed(path, value.asDictionary());
  }

  // The delay holds whatever the records are.
  Answer readDelayed(const std::string& path, const Dictionary* entries) {
    Answer answer;
    const Array* records = entries != nullptr ? ArrayEntry(*entries, "Records") : nullptr;
    const PropertyValue* delay = entries != nullptr ? entries->find("Delay") : nullptr;
    if (delay != nullptr && delay->asNumber() != nullptr) {
      const double seconds = delay->asNumber()->toDouble();
      // Neither NaN nor a negative delay is above 0.
      if (seconds > 0) {
        answer.delay = std::chrono::duration_cast<std::chrono::nanoseconds>(
            std::chrono::duration<double>(std::min(seconds, kMaxDelaySeconds)));
      }
    } else if (delay != nullptr && records != nullptr) {
      log_.error("The delay in %@ is not a number", path);
    }
    if (records == nullptr) {
      log_.error("%@ holds no array of records", path);
    } else {
      answer.records = *records;
    }
    return answer;
  }

  // A service manager that is late has not answered: an empty reply would say that nobody has used
  // the network, and the counts to compare with would be gone.
  Answer readUnits() {
    Answer answer{.delay = {}, .records = ReadUnitUsage(root_, kUnitUsageLimit)};
    if (!answer.records) {
      log_.error("The service manager did not say what its services transferred");
    }
    return answer;
  }

  const Root root_;
  SystemLog& log_;
  const std::shared_ptr<Semaphore> stop_;  // counts the queries that are to end
  std::mutex mutex_;
  std::vector<std::future<void>> queries_;
};

}  // namespace

std::unique_ptr<NetworkUsage> MakeLinuxNetworkUsage(const Root& root, SystemLog& log) {
  return std::make_unique<LinuxNetworkUsage>(root, log);
}

}  // namespace quorlet
