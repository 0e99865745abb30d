// generate_store ROOT DATABASE
//
// Lays out a root whose daily pass has the sample store to report: a whitelist that allows every
// key (half of the scalars rounded, a fifth of the distributions with a histogram) and the owner's
// consent; beside it /every_key.plist, the same whitelist with an entry for each key. Also writes
// the same values to a plain table of an SQLite database, for comparison.
#include <sqlite3.h>

#include <cstdio>

#include "platform/linux/linux_platform.h"
#include "sample_store.h"
#include "values/property_list.h"

namespace quorlet::bench {
namespace {

// A whitelist by subsystem, or with one entry for each key, which says the same.
Dictionary Whitelist(bool everyKey) {
  Dictionary scalars;
  for (int i = 0; i < (everyKey ? kScalars : kSubsystems); ++i) {
    Dictionary options;
    if (i % 4 == 0) options["sig_fig"] = Int64(2);
    if (i % 4 == 1) options["bucket_interval"] = Int64(100);
    scalars[everyKey ? ScalarKey(i) : SubsystemPrefix(i)] = options;
  }
  Dictionary distributions;
  for (int i = 0; i < (everyKey ? kDistributions : kSubsystems); ++i) {
    Dictionary options;
    if (i % 5 == 0) {
      options["intervals"] = Array{Int64(1),  Int64(2),   Int64(5),   Int64(10),  Int64(20),
                                   Int64(50), Int64(100), Int64(200), Int64(500), Int64(1000)};
    }
    distributions[everyKey ? DistributionKey(i) : SubsystemPrefix(i)] = options;
  }
  return {{"Bench",
           Dictionary{{everyKey ? "ScalarKeys" : "ScalarKeyPrefixes", scalars},
                      {everyKey ? "DistributionKeys" : "DistributionKeyPrefixes", distributions}}}};
}

bool WritePlist(const std::string& path, const Dictionary& root) {
  const auto document = WriteXmlPropertyList(root);
  const auto* text = std::get_if<std::string>(&document);
  return text != nullptr && WriteWholeFile(path, *text) == 0;
}

bool WritePlainTable(const char* path, std::int32_t day) {
  sqlite3* database = nullptr;
  sqlite3_stmt* insert = nullptr;
  bool good = sqlite3_open(path, &database) == SQLITE_OK &&
              sqlite3_exec(database,
                           "CREATE TABLE samples(key TEXT, day INTEGER, second INTEGER, v REAL);"
                           "BEGIN",
                           nullptr, nullptr, nullptr) == SQLITE_OK &&
              sqlite3_prepare_v2(database, "INSERT INTO samples VALUES(?1, ?2, ?3, ?4)", -1,
                                 &insert, nullptr) == SQLITE_OK;
  for (int i = 0; good && i < kDistributions; ++i) {
    const std::string key = DistributionKey(i);
    int second = 0;
    for (const double value : SampleValues(i, day).values) {
      sqlite3_bind_text(insert, 1, key.c_str(), -1, SQLITE_STATIC);
      sqlite3_bind_int(insert, 2, day);
      sqlite3_bind_int(insert, 3, second++ * 86400 / kValuesPerDistribution);
      sqlite3_bind_double(insert, 4, value);
      good = good && sqlite3_step(insert) == SQLITE_DONE;
      sqlite3_reset(insert);
    }
  }
  sqlite3_finalize(insert);
  good = good && sqlite3_exec(database, "COMMIT", nullptr, nullptr, nullptr) == SQLITE_OK;
  sqlite3_close(database);
  return good;
}

int Run(const char* directory, const char* plainDatabase) {
  LinuxPlatform platform{Root(directory), Access::kReadWrite};
  const Root& root = platform.root();
  const std::int32_t yesterday = platform.services().counterStore.TLDaysSince1970() - 1;
  const bool good =
      FillStore(platform.services().counterStore, yesterday) &&
      WritePlist(root.path("/Library/Application Support/TallyLedger/Whitelist_Zed.plist"),
                 Whitelist(false)) &&
      WritePlist(root.path("/every_key.plist"), Whitelist(true)) &&
      WritePlist(root.path("/var/mobile/Library/Preferences/nuvex.diagwell.plist"),
                 {{"SubmissionEnabled", true}}) &&
      WritePlainTable(plainDatabase, yesterday);
  if (!good) std::fprintf(stderr, "generate_store: cannot write to %s\n", directory);
  return good ? 0 : 1;
}

}  // namespace
}  // namespace quorlet::bench

int main(int argumentCount, char** arguments) {
  if (argumentCount != 3) {
    std::fprintf(stderr, "usage: generate_store ROOT DATABASE\n");
    return 2;
  }
  return quorlet::bench::Run(arguments[1], arguments[2]);
}
