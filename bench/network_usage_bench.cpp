// What a reply of the network-usage service with 10,000 processes costs, all of whose counts have
// grown, beside 40,000 prepared upserts of the same keys in one transaction.
#include <benchmark/benchmark.h>
#include <sqlite3.h>
#include <stdlib.h>

#include <array>
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <memory>
#include <string>
#include <system_error>
#include <vector>

#include "collectors/network_usage.h"
#include "platform/linux/base/services.h"
#include "platform/linux/linux_platform.h"
#include "platform/network_usage.h"

namespace quorlet::bench {
namespace {

constexpr int kProcesses = 10'000;
constexpr std::array kFields = {"wifiIn", "wifiOut", "wwanIn", "wwanOut"};

// Reverse-domain names in no particular order, as a service hands them out.
std::string ProcessName(int number) {
  const unsigned scattered = static_cast<unsigned>(number) * 2654435761U;
  return "org.example." + std::to_string(scattered) + ".helper";
}

class TemporaryDirectory {
 public:
  TemporaryDirectory() {
    std::string pattern = (std::filesystem::temp_directory_path() / "quorlet-bench-XXXXXX");
    if (mkdtemp(pattern.data()) == nullptr) std::abort();
    path_ = pattern;
  }
  TemporaryDirectory(const TemporaryDirectory&) = delete;
  TemporaryDirectory& operator=(const TemporaryDirectory&) = delete;
  ~TemporaryDirectory() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
  }
  const std::string& path() const { return path_; }

 private:
  std::string path_;
};

Array Records(Date since, std::int64_t count) {
  Array records;
  for (int i = 0; i < kProcesses; ++i) {
    Dictionary record{{"procName", ProcessName(i)}, {UsageSinceTimeKey, since}};
    for (const char* field : kFields) record[std::string(field) + "Bytes"] = Int64(count);
    records.push_back(record);
  }
  return records;
}

void ProcessReply(benchmark::State& state) {
  const TemporaryDirectory directory;
  LinuxPlatform device(Root(directory.path()), Access::kReadWrite, MakeStandardErrorLog());
  Platform& platform = device.services();
  const Date since = platform.clock.now();
  std::int64_t count = 1'000'000;
  processDataUsageReply(Records(since, count), platform);
  for (auto _ : state) {
    state.PauseTiming();
    const Array records = Records(since, count += 1'000'000);
    state.ResumeTiming();
    processDataUsageReply(records, platform);
  }
}
BENCHMARK(ProcessReply)->Unit(benchmark::kMillisecond);

void Check(int code) {
  if (code != SQLITE_OK && code != SQLITE_DONE) std::abort();
}

// The peer: a table like the counter store's with the same settings.
void PreparedUpserts(benchmark::State& state) {
  const TemporaryDirectory directory;
  std::vector<std::string> keys;
  for (int i = 0; i < kProcesses; ++i) {
    for (const char* field : kFields) {
      keys.push_back(std::string("datausage.") + field + "KB.nuvex." + ProcessName(i));
    }
  }
  sqlite3* database = nullptr;
  Check(sqlite3_open((directory.path() + "/peer.db").c_str(), &database));
  const auto execute = [&](const char* sql) {
    Check(sqlite3_exec(database, sql, nullptr, nullptr, nullptr));
  };
  execute(
      "PRAGMA page_size = 4096; PRAGMA cache_size = -2048; PRAGMA journal_mode = TRUNCATE;"
      "PRAGMA synchronous = NORMAL;"
      "CREATE TABLE scalars(day INTEGER NOT NULL, key BLOB NOT NULL, value INTEGER NOT NULL,"
      " PRIMARY KEY(day, key)) WITHOUT ROWID");
  sqlite3_stmt* upsert = nullptr;
  Check(sqlite3_prepare_v2(database,
                           "INSERT INTO scalars VALUES(20000, ?1, ?2)"
                           " ON CONFLICT(day, key) DO UPDATE SET value = value + excluded.value",
                           -1, &upsert, nullptr));
  const auto transaction = [&] {
    execute("BEGIN IMMEDIATE");
    for (const std::string& key : keys) {
      Check(sqlite3_bind_blob(upsert, 1, key.data(), static_cast<int>(key.size()), SQLITE_STATIC));
      Check(sqlite3_bind_int64(upsert, 2, 976));
      Check(sqlite3_step(upsert));
      sqlite3_reset(upsert);
    }
    execute("COMMIT");
  };
  transaction();
  for (auto _ : state) transaction();
  sqlite3_finalize(upsert);
  sqlite3_close(database);
}
BENCHMARK(PreparedUpserts)->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace quorlet::bench

BENCHMARK_MAIN();
