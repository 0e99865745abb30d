// What every counter store does, asked of the Linux one and of the fake; then what only the Linux
// one can get wrong: damage, several processes, killed writers, read-only access.
#include <gtest/gtest.h>
#include <sqlite3.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cmath>
#include <csignal>

#include "fakes/fake_platform.h"
#include "fakes/temp_root.h"
#include "platform/linux/counters/counter_store.h"

namespace quorlet {
namespace {

using namespace std::string_literals;
using Samples = std::vector<DistributionSample>;
using History = std::unique_ptr<TLHistory>;

constexpr char kDatabase[] = "/var/mobile/Library/TallyLedger/TLDataStore.sqlitedb";
constexpr std::int32_t kToday = 20000;

Samples Ramp(int count) {
  Samples samples;
  for (int i = 0; i < count; ++i) samples.push_back({i * 0.5, i});
  return samples;
}

// A row of a distribution as text, in which NaN equals NaN.
std::string Row(std::string_view key, std::int32_t day, const Samples& samples) {
  std::string row = std::string(key) + " " + std::to_string(day) + ":";
  for (const auto& [value, second] : samples) {
    row += " " + std::to_string(value) + "@" + std::to_string(second);
  }
  return row + "\n";
}
std::string Scalars(const History& history, std::string_view prefix = "", std::int32_t minDay = 0,
                    std::int32_t maxDay = kToday) {
  std::string rows;
  if (history == nullptr) return "no history";
  history->scalarsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
      prefix, minDay, maxDay, [&](auto key, auto day, auto value, bool&) {
        rows += std::string(key) + " " + std::to_string(day) + ": " + std::to_string(value) + "\n";
      });
  return rows;
}
std::string Distributions(const History& history, std::string_view prefix = "",
                          std::int32_t minDay = 0, std::int32_t maxDay = kToday) {
  std::string rows;
  if (history == nullptr) return "no history";
  history->distributionsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
      prefix, minDay, maxDay, [&](auto key, auto day, auto& values, bool&) {
        Samples samples;
        DistributionSample sample;
        while (values.getNextValueSecondsInDayOffset(sample.value, sample.secondsInDay)) {
          samples.push_back(sample);
        }
        rows += Row(key, day, samples);
      });
  return rows;
}

// Samples of a key, and what is added to "sum".
StoreChanges Changes(std::string_view key, std::int32_t day, const Samples& samples,
                     std::int64_t sum = 0) {
  StoreChanges changes;
  RecordedValues& recorded = changes.values.emplace_back();
  recorded.key = key;
  recorded.day = day;
  for (const auto& [value, second] : samples) recorded.add(value, second);
  if (sum != 0) changes.scalars.push_back({ScalarChange::Kind::kAdd, "sum", sum, day});
  return changes;
}

// A process with the store of a root. Whatever logs an error line fails the test that did not
// expect (and take) it.
struct LinuxSubject {
  explicit LinuxSubject(const TempRoot& root, Access access = Access::kReadWrite)
      : store(MakeLinuxCounterStore(root.root(), access, clock, queries, preferences, log)) {}
  ~LinuxSubject() { EXPECT_EQ(log.errors(), std::vector<std::string>{}); }
  History history() { return store->initWithDefaultPath(); }
  bool record(std::string_view key, const Samples& samples, std::int64_t sum = 0) {
    return store->write(Changes(key, kToday, samples, sum));
  }
  // How many error lines there were since the last call.
  std::size_t takeErrors() { return std::exchange(log.lines, {}).size(); }
  std::int64_t corruptionCount() {
    return preferences.DGWPreferencesGetIntegerValue("DatabaseCorruptionCount", "nuvex.aggregated");
  }

  FakeSystemLog log;
  FakeDeviceInfo deviceInfo;
  FakeEnvironment environment;
  FakePreferences preferences;
  EnvironmentQueries queries{deviceInfo, environment, log};
  FakeClock clock;
  std::unique_ptr<CounterStore> store;
};

TEST(CounterStoreContract, TheFakeAndTheLinuxStoreGiveTheSameRows) {
  FakeClock clock;
  FakeCounterStore fake(clock);
  const TempRoot root;
  LinuxSubject subject(root);
  const auto& store = subject.store;
  for (const std::int32_t day : {kToday - 31, kToday + 1, kToday - 30, kToday}) {
    clock.goToDay(day);
    subject.clock.goToDay(day);
    for (const auto& key : {"b"s, "\xff\xff\x01"s, "\xff"s, "ab"s, "a\xff\xff"s, "a\xff"s,
                            "a\xc3\xa4"s, "a\0b"s, "a"s, ""s}) {
      for (CounterStore* each : {store.get(), static_cast<CounterStore*>(&fake)}) {
        each->TLClientSetValueForScalarKey(key, 9);
        each->TLClientAddValueForScalarKey(key, -12);
        each->TLClientAddValueForScalarKey(key + "low", -INT64_MAX);
        each->TLClientAddValueForScalarKey(key + "low", -INT64_MAX);
        EXPECT_TRUE(each->write(Changes(key, day, {{2, 3}, {4, 3}, {1, 5}})));
      }
    }
  }
  store->TLClientCheckpoint();  // drops what is older than 30 days
  fake.TLClientCheckpoint();
  EXPECT_EQ(Scalars(subject.history(), "b", 0),
            "b 19970: -3\nb 20000: -3\n"
            "blow 19970: -9223372036854775808\nblow 20000: -9223372036854775808\n");
  std::string keys[2];
  for (const int i : {0, 1}) {
    CounterStore& each = i == 0 ? *store : fake;
    EXPECT_TRUE(each.keysOfDay(kToday, [&](std::string_view key, auto values) {
      keys[i] += std::string(key) + " " + std::to_string(values.value_or(99)) + "\n";
      return key != "b" || !values;
    }));
  }
  EXPECT_EQ(keys[0], keys[1]);
  EXPECT_TRUE(keys[0].ends_with("b 3\n")) << keys[0];
  for (const std::string prefix : {"", "a", "a\xff", "ab", "b", "c", "\xff", "\xff\xff"}) {
    for (const auto& [low, high] :
         {std::pair{0, kToday + 1}, {kToday - 30, kToday}, {kToday, kToday}, {kToday + 1, 0}}) {
      const auto mine = subject.history();
      const auto faked = fake.initWithDefaultPath();
      EXPECT_EQ(Scalars(mine, prefix, low, high), Scalars(faked, prefix, low, high));
      EXPECT_EQ(Distributions(mine, prefix, low, high), Distributions(faked, prefix, low, high));
    }
  }
}

TEST(LinuxCounterStore, ValuesComeInTheOrderRecorded) {
  const TempRoot root;
  LinuxSubject subject(root);
  Samples all;
  // Singly, and in batches around every size that values are stored in.
  for (const int batch : {1, 1, 13, 1, 1, 14, 16, 17, 95, 97, 380, 721, 1403, 1500}) {
    Samples samples = Ramp(batch);
    samples[0] = {batch % 2 == 0 ? NAN : -HUGE_VAL, -batch};
    EXPECT_TRUE(subject.record("r", samples));
    all.insert(all.end(), samples.begin(), samples.end());
    ASSERT_EQ(Distributions(subject.history(), "r"), Row("r", kToday, all));
  }
}

// The store's bytes, and the names of its files.
std::string State(const TempRoot& root) {
  std::string state = root.read(kDatabase) + root.read(kDatabase + "-journal"s);
  for (const auto& name : root.list("/var/mobile/Library/TallyLedger")) state += name;
  return state;
}

void RunSql(const TempRoot& root, const std::string& sql) {
  sqlite3* database = nullptr;
  sqlite3_open(root.path(kDatabase).c_str(), &database);
  EXPECT_EQ(sqlite3_exec(database, sql.c_str(), nullptr, nullptr, nullptr), SQLITE_OK) << sql;
  sqlite3_close(database);
}

// Runs `work` in a process of its own, which ends with its result as the status.
pid_t Fork(const std::function<int()>& work) {
  const pid_t child = fork();
  if (child == 0) _exit(work());
  return child;
}
int StatusOf(pid_t child) {
  int status = 0;
  waitpid(child, &status, 0);
  return WEXITSTATUS(status);
}

TEST(LinuxCounterStore, ProcessesLoseNothingAndKilledOnesLeaveWholeTransactions) {
  const TempRoot root;
  root.write(kDatabase, std::string(9000, 'x'));  // damage, which one of them replaces
  const auto write = [&](int times) {
    LinuxSubject subject(root);
    bool good = true;
    for (int n = 0; good && n < times; ++n) {
      good = subject.record("d", Ramp(9), 9);
    }
    subject.takeErrors();
    return good ? static_cast<int>(subject.corruptionCount()) : 99;
  };
  std::vector<pid_t> children;
  for (int i = 0; i < 12; ++i) children.push_back(Fork([&] { return write(10); }));
  int replaced = 0;
  for (const pid_t child : children) replaced += StatusOf(child);
  EXPECT_EQ(replaced, 1);
  EXPECT_EQ(Scalars(LinuxSubject(root).history()), "sum 20000: 1080\n");
  for (int round = 0; round < 20; ++round) {
    LinuxSubject reader(root, round % 2 == 0 ? Access::kReadOnly : Access::kReadWrite);
    const auto values = std::ranges::count(Distributions(reader.history()), '@');
    EXPECT_EQ(Scalars(reader.history()), "sum 20000: " + std::to_string(values) + "\n");
    const pid_t child = Fork([&] { return write(1 << 30); });
    usleep(static_cast<useconds_t>(2000 + 1500 * round));
    kill(child, SIGKILL);
    StatusOf(child);
  }
}

// A sound store with a scalar and two distributions.
void Fill(const TempRoot& root) {
  const TempRoot own;
  {
    LinuxSubject subject(own);
    EXPECT_TRUE(subject.record("d", Ramp(200), 7));
    EXPECT_TRUE(subject.record("e", Ramp(3000)));
  }
  // The file alone: whoever ends has copied the log back.
  root.write(kDatabase, own.read(kDatabase));
}

// Run on the sound database; the first one is done to its bytes.
const std::string kDamages[] = {
    "overwritten and cut",
    "PRAGMA application_id = 1",
    "DROP TABLE blocks",
    "UPDATE sequences SET id = 9223372036854775807",
    "UPDATE blocks SET samples = x'00'",
    "UPDATE blocks SET samples = zeroblob(3000000)",
    "UPDATE blocks SET samples = CAST(x'0000000000000000ffffffff' ||"
    " zeroblob(length(samples) - 12) AS BLOB)",
    "UPDATE blocks SET samples = zeroblob(length(samples))",
};

TEST(LinuxCounterStore, ADamagedDatabaseIsReplaced) {
  for (const std::string& damage : kDamages) {
    for (const bool byReading : {true, false}) {
      SCOPED_TRACE(damage + (byReading ? ", read" : ", written"));
      const TempRoot root;
      Fill(root);
      const std::string sound = root.read(kDatabase);
      if (damage == kDamages[0]) {
        root.write(kDatabase, sound.substr(0, 4096) + std::string(sound.size() - 9000, '\xa5'));
      } else {
        RunSql(root, damage);
      }
      const std::string damaged = root.read(kDatabase);

      const std::string before = State(root);
      LinuxSubject preview(root, Access::kReadOnly);
      Distributions(preview.history());
      EXPECT_FALSE(preview.record("s", Ramp(1)));
      EXPECT_EQ(preview.takeErrors(), 2u);
      EXPECT_TRUE(State(root) == before);

      LinuxSubject subject(root);
      if (byReading) Distributions(subject.history());
      EXPECT_TRUE(subject.record("d", Ramp(2)));
      EXPECT_EQ(subject.takeErrors(), 1u);
      EXPECT_EQ(subject.corruptionCount(), 1);
      EXPECT_TRUE(root.read(kDatabase + ".damaged"s) == damaged);
      EXPECT_EQ(Distributions(subject.history()), Row("d", kToday, Ramp(2)));
    }
  }
}

}  // namespace
}  // namespace quorlet
