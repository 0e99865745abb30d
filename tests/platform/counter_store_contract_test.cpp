// What every counter store does, asked of the Linux one and of the fake; then what only the Linux
// one can get wrong: damage, several processes, killed writers, full disks, read-only access.
#include <gtest/gtest.h>
#include <sqlite3.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <limits>

#include "fakes/fake_platform.h"
#include "fakes/temp_root.h"
#include "platform/linux/counter_store.h"
#include "platform/linux/tally_ledger.h"

namespace quorlet {
namespace {

using namespace std::string_literals;
using Samples = std::vector<DistributionSample>;
using Scalar = std::tuple<std::string, std::int32_t, std::int64_t>;

constexpr char kDatabase[] = "/var/mobile/Library/TallyLedger/TLDataStore.sqlitedb";
constexpr std::int32_t kToday = 20000;

Samples Ramp(int count) {
  Samples samples;
  for (int i = 0; i < count; ++i) samples.push_back({i * 0.5, i});
  return samples;
}

using History = std::unique_ptr<TLHistory>;
std::vector<Scalar> Scalars(const History& history, std::string_view prefix = "",
                            std::int32_t minDay = 0, std::int32_t maxDay = kToday) {
  std::vector<Scalar> rows;
  if (history == nullptr) return rows;
  history->scalarsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
      prefix, minDay, maxDay, [&](auto key, auto day, auto value, bool&) {
        rows.emplace_back(std::string(key), day, value);
      });
  return rows;
}

// A row of a distribution as text, in which NaN equals NaN.
std::string Row(std::string_view key, const Samples& samples, std::int32_t day = kToday) {
  std::string row = std::string(key) + " " + std::to_string(day) + ":";
  for (const auto& [value, second] : samples) {
    row += " " + std::to_string(value) + "@" + std::to_string(second);
  }
  return row;
}

std::vector<std::string> Distributions(const History& history, std::string_view prefix = "",
                                       std::int32_t minDay = 0, std::int32_t maxDay = kToday) {
  std::vector<std::string> rows;
  if (history == nullptr) return rows;
  history->distributionsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
      prefix, minDay, maxDay, [&](auto key, auto day, auto& values, bool&) {
        Samples samples;
        DistributionSample sample;
        while (values.getNextValueSecondsInDayOffset(sample.value, sample.secondsInDay)) {
          samples.push_back(sample);
        }
        rows.push_back(Row(key, samples, day));
      });
  return rows;
}

// A store under test, and the way values get into it.
struct FakeSubject {
  CounterStore& store() { return fake; }
  std::unique_ptr<TLHistory> history() { return fake.initWithDefaultPath(); }
  void record(std::string_view key, std::int32_t day, const Samples& samples) {
    Samples& all = fake.distributions[{std::string(key), day}];
    all.insert(all.end(), samples.begin(), samples.end());
  }
  FakeClock clock;
  FakeCounterStore fake{clock};
};

// A process with the ledger of a root. Whatever logs an error line fails the test that did not
// expect (and clear) it.
struct LinuxSubject {
  explicit LinuxSubject(const TempRoot& root, Access access = Access::kReadWrite)
      : ledger(MakeTallyLedger(root.root(), access, queries, preferences, log)),
        counters(MakeLinuxCounterStore(*ledger, clock)) {}
  ~LinuxSubject() { EXPECT_EQ(log.errors(), std::vector<std::string>{}); }
  CounterStore& store() { return *counters; }
  std::unique_ptr<TLHistory> history() { return counters->initWithDefaultPath(); }
  void record(std::string_view key, std::int32_t day, const Samples& samples) {
    EXPECT_TRUE(ledger->recordValues(key, day, samples));
  }
  // How many error lines there were since the last call.
  std::size_t takeErrors() { return std::exchange(log.lines, {}).size(); }
  std::int64_t corruptionCount() {
    return preferences.DGWPreferencesGetIntegerValue("DatabaseCorruptionCount", "nuvex.aggregated");
  }

  FakeClock clock;
  FakeSystemLog log;
  FakeDeviceInfo deviceInfo;
  FakeEnvironment environment;
  FakePreferences preferences;
  EnvironmentQueries queries{deviceInfo, environment, log};
  std::unique_ptr<TallyLedger> ledger;
  std::unique_ptr<CounterStore> counters;
};

struct OwnRoot {
  TempRoot root;
};
struct LinuxSubjectOnItsOwn : OwnRoot, LinuxSubject {
  LinuxSubjectOnItsOwn() : LinuxSubject(root) {}
};

template <typename TestSubject>
class CounterStoreContract : public testing::Test {
 protected:
  TestSubject subject;
  CounterStore& store = subject.store();
};
using Stores = testing::Types<FakeSubject, LinuxSubjectOnItsOwn>;
TYPED_TEST_SUITE(CounterStoreContract, Stores);

TYPED_TEST(CounterStoreContract, ScalarsBelongToTheDayOfTheClock) {
  constexpr auto kMax = std::numeric_limits<std::int64_t>::max();
  constexpr auto kMin = std::numeric_limits<std::int64_t>::min();
  this->store.TLClientSetValueForScalarKey("set", 1);
  this->store.TLClientSetValueForScalarKey("set", -2);
  this->store.TLClientAddValueForScalarKey("added", 3);
  this->store.TLClientAddValueForScalarKey("added", 4);
  for (int i = 0; i < 2; ++i) {
    this->store.TLClientAddValueForScalarKey("high", kMax);
    this->store.TLClientAddValueForScalarKey("low", kMin);
  }
  this->subject.clock.goToDay(kToday + 1);
  this->store.TLClientAddValueForScalarKey("added", 5);
  EXPECT_EQ(Scalars(this->subject.history(), "", 0, kToday + 1),
            (std::vector<Scalar>{{"added", kToday, 7},
                                 {"added", kToday + 1, 5},
                                 {"high", kToday, kMax},
                                 {"low", kToday, kMin},
                                 {"set", kToday, -2}}));
  this->subject.clock.seconds = -0.5;
  EXPECT_EQ(this->store.TLDaysSince1970(), -1);
  EXPECT_EQ(this->store.dateForDaysSince1970(-1), Date{-86400});
}

TYPED_TEST(CounterStoreContract, RowsComeInByteOrderWithinPrefixAndDays) {
  const std::vector<std::string> keys = {"",      "a",         "a\0b"s, "ab",   "a\xc3\xa4",
                                         "a\xff", "a\xff\xff", "b",     "\xff", "\xff\xff\x01"};
  for (const std::int32_t day : {kToday - 1, kToday + 1, kToday}) {
    this->subject.clock.goToDay(day);
    // Made in the opposite order.
    for (auto key = keys.rbegin(); key != keys.rend(); ++key) {
      this->store.TLClientSetValueForScalarKey(*key, 1);
      this->subject.record(*key, day, {{2, 3}});
    }
  }
  const auto history = this->subject.history();
  for (const std::string prefix : {"", "a", "a\xff", "ab", "b", "c", "\xff", "\xff\xff"}) {
    for (const auto& [low, high] : {std::pair{kToday - 1, kToday},
                                    {kToday - 2, kToday + 1},
                                    {kToday, kToday},
                                    {kToday + 1, kToday - 1}}) {
      std::vector<Scalar> scalars;
      std::vector<std::string> distributions;
      for (const std::string& key : keys) {
        for (std::int32_t day = low + 1; key.starts_with(prefix) && day <= high; ++day) {
          scalars.emplace_back(key, day, 1);
          distributions.push_back(Row(key, {{2, 3}}, day));
        }
      }
      EXPECT_EQ(Scalars(history, prefix, low, high), scalars) << prefix;
      EXPECT_EQ(Distributions(history, prefix, low, high), distributions) << prefix;
    }
  }
  // A handler may leave the values unread, and ends the enumeration.
  std::string seen;
  history->distributionsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
      "a", 0, kToday - 1, [&](auto key, auto, auto&, bool& stop) {
        seen += std::string(key) + ";";
        stop = seen == "a;a\0b;"s;
      });
  EXPECT_EQ(seen, "a;a\0b;"s);
}

TYPED_TEST(CounterStoreContract, ValuesComeInTheOrderRecorded) {
  const double infinity = std::numeric_limits<double>::infinity();
  const Samples odd = {{std::numeric_limits<double>::quiet_NaN(), 86399},
                       {-0.0, 0},
                       {infinity, -1},
                       {-infinity, std::numeric_limits<std::int32_t>::max()}};
  this->subject.record("odd", kToday, odd);
  EXPECT_EQ(Distributions(this->subject.history()), std::vector{Row("odd", odd)});
  // Singly, in batches around every size that values are stored in, and at last all at once.
  const Samples ramp = Ramp(6000);
  std::size_t recorded = 0;
  for (const int batch : {1, 1, 13, 1, 1, 14, 16, 17, 95, 97, 380, 721, 1403, 1500}) {
    const auto begin = ramp.begin() + static_cast<std::ptrdiff_t>(recorded);
    this->subject.record("ramp", kToday, Samples(begin, begin + batch));
    recorded += static_cast<std::size_t>(batch);
    this->subject.record("other", kToday, {{1, 1}});
    const Samples sofar(ramp.begin(), begin + batch);
    ASSERT_EQ(Distributions(this->subject.history(), "ramp"), std::vector{Row("ramp", sofar)});
  }
  this->subject.record("whole", kToday, ramp);
  EXPECT_EQ(Distributions(this->subject.history(), "whole"), std::vector{Row("whole", ramp)});
}

TYPED_TEST(CounterStoreContract, ACheckpointDropsWhatIsOlderThanThirtyDays) {
  for (const std::int32_t day : {kToday - 31, kToday - 30, kToday + 5}) {
    this->subject.clock.goToDay(day);
    this->store.TLClientSetValueForScalarKey("k", day);
    this->subject.record("d", day, {{1, 1}});
  }
  this->subject.clock.goToDay(kToday);
  this->store.TLClientCheckpoint();
  const auto history = this->subject.history();
  EXPECT_EQ(Scalars(history, "", -1, kToday + 9),
            (std::vector<Scalar>{{"k", kToday - 30, kToday - 30}, {"k", kToday + 5, kToday + 5}}));
  EXPECT_EQ(Distributions(history, "", -1, kToday + 9),
            (std::vector{Row("d", {{1, 1}}, kToday - 30), Row("d", {{1, 1}}, kToday + 5)}));
}

// --- Linux only ---------------------------------------------------------------------------------

// Every file below the store's directory with its content, size and time of change.
std::map<std::string, std::string> Tree(const TempRoot& root) {
  std::map<std::string, std::string> tree;
  for (const auto& entry : std::filesystem::recursive_directory_iterator(root.directory())) {
    const std::string name = entry.path().string().substr(root.directory().size());
    tree[name] = std::to_string(entry.last_write_time().time_since_epoch().count());
    if (entry.is_regular_file()) tree[name] += root.read(name);
  }
  return tree;
}

void RunSql(const std::string& path, const std::string& sql, bool thenDie = false) {
  sqlite3* database = nullptr;
  ASSERT_EQ(sqlite3_open(path.c_str(), &database), SQLITE_OK);
  const std::string all = "PRAGMA synchronous = OFF;" + sql;
  EXPECT_EQ(sqlite3_exec(database, all.c_str(), nullptr, nullptr, nullptr), SQLITE_OK) << sql;
  if (thenDie) _exit(0);
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
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

TEST(LinuxCounterStore, WithoutADataHomeThereIsNothingToWorkOn) {
  LinuxSubjectOnItsOwn subject;
  subject.environment.userMode = 1;
  subject.environment.containerError = 2;
  EXPECT_FALSE(subject.ledger->setScalar("s", kToday, 1));
  EXPECT_EQ(subject.history(), nullptr);
  EXPECT_EQ(subject.root.list("/"), std::vector<std::string>{});
}

TEST(LinuxCounterStore, ATransactionIsKeptOrDroppedWhole) {
  LinuxSubjectOnItsOwn subject;
  const auto work = [&](bool keep) {
    return [&, keep] {
      return subject.ledger->setScalar("s", kToday, 1) &&
             subject.ledger->recordValues("d", kToday, Ramp(5000)) && keep;
    };
  };
  EXPECT_FALSE(subject.ledger->inTransaction(work(false)));
  EXPECT_EQ(subject.history(), nullptr);
  EXPECT_TRUE(subject.ledger->inTransaction(work(true)));
  EXPECT_EQ(Distributions(subject.history()), std::vector{Row("d", Ramp(5000))});
  EXPECT_FALSE(subject.ledger->setScalar(std::string(70000, 'k'), kToday, 1));
  EXPECT_EQ(subject.takeErrors(), 1u);
}

TEST(LinuxCounterStore, TwelveProcessesLoseNothingAndReplaceDamageOnce) {
  const TempRoot root;
  root.write(kDatabase, std::string(9000, 'x'));
  std::vector<pid_t> children;
  for (int i = 0; i < 12; ++i) {
    children.push_back(Fork([&] {
      LinuxSubject subject(root);
      bool good = true;
      for (int n = 0; n < 10; ++n) {
        good = good && subject.ledger->addToScalar("sum", kToday, 1) &&
               subject.ledger->recordValues("d", kToday, {{{0.5, 1}, {1, 2}}});
      }
      subject.takeErrors();
      return good ? static_cast<int>(subject.corruptionCount()) : 99;
    }));
  }
  int replaced = 0;
  for (const pid_t child : children) replaced += StatusOf(child);
  EXPECT_EQ(replaced, 1);
  LinuxSubject reader(root);
  EXPECT_EQ(Scalars(reader.history()), (std::vector<Scalar>{{"sum", kToday, 120}}));
  Samples all;
  for (int i = 0; i < 120; ++i) all.insert(all.end(), {{0.5, 1}, {1, 2}});
  EXPECT_EQ(Distributions(reader.history()), std::vector{Row("d", all)});
}

// A sound store with a scalar and two distributions, recorded once.
void Fill(const TempRoot& root) {
  static const std::string bytes = [] {
    LinuxSubjectOnItsOwn subject;
    subject.store().TLClientSetValueForScalarKey("s", 7);
    subject.record("d", kToday, Ramp(200));
    subject.record("e", kToday, Ramp(3000));
    return subject.root.read(kDatabase);
  }();
  root.write(kDatabase, bytes);
}

struct Damage {
  const char* name;
  std::string sql;                              // run on the sound database, or
  std::function<void(std::string&)> onBytes{};  // done to its bytes
};

const Damage kDamages[] = {
    {"no database at all", "", [](std::string& bytes) { bytes.assign(5000, 'x'); }},
    {"cut in a page", "", [](std::string& bytes) { bytes.resize(bytes.size() - 6000); }},
    {"tables overwritten", "",
     [](std::string& bytes) { std::fill(bytes.begin() + 4096, bytes.end(), '\xa5'); }},
    {"another program's", "PRAGMA application_id = 1"},
    {"a later version's", "PRAGMA user_version = 2"},
    {"a table missing", "DROP TABLE blocks"},
    {"sequence number below 0", "UPDATE sequences SET id = -1"},
    {"sequence number too high", "UPDATE sequences SET id = 9223372036854775807"},
    {"block size odd", "UPDATE blocks SET samples = x'00'"},
    {"block too large", "UPDATE blocks SET samples = zeroblob(3000000)"},
    {"more values than fit",
     "UPDATE blocks SET samples = CAST(x'0000000000000000ffffffff' ||"
     " zeroblob(length(samples) - 12) AS BLOB)"},
    {"blocks without values", "UPDATE blocks SET samples = zeroblob(length(samples))"},
};

TEST(LinuxCounterStore, ADamagedDatabaseIsReplaced) {
  for (const Damage& damage : kDamages) {
    for (const bool byReading : {true, false}) {
      SCOPED_TRACE(std::string(damage.name) + (byReading ? ", read" : ", written"));
      const TempRoot root;
      Fill(root);
      if (damage.onBytes) {
        std::string bytes = root.read(kDatabase);
        damage.onBytes(bytes);
        root.write(kDatabase, bytes);
      } else {
        RunSql(root.path(kDatabase), damage.sql);
      }
      const std::string damaged = root.read(kDatabase);

      const auto before = Tree(root);
      LinuxSubject preview(root, Access::kReadOnly);
      Distributions(preview.history());
      EXPECT_FALSE(preview.ledger->setScalar("s", kToday, 1));
      EXPECT_EQ(preview.takeErrors(), 2u);
      EXPECT_TRUE(Tree(root) == before);

      LinuxSubject subject(root);
      if (byReading) {
        Distributions(subject.history());
      } else {
        EXPECT_TRUE(subject.ledger->recordValues("d", kToday, Ramp(2)));
      }
      EXPECT_EQ(subject.takeErrors(), 1u);
      EXPECT_EQ(subject.corruptionCount(), 1);
      EXPECT_TRUE(root.read(kDatabase + ".damaged"s) == damaged);
      if (byReading) subject.record("d", kToday, Ramp(2));
      EXPECT_EQ(Distributions(subject.history()), std::vector{Row("d", Ramp(2))});
    }
  }
}

TEST(LinuxCounterStore, AReplacedDatabaseIsNoticedByOpenLedgers) {
  const TempRoot root;
  LinuxSubject first(root);
  first.store().TLClientSetValueForScalarKey("old", 1);
  std::filesystem::rename(root.path(kDatabase), root.path(kDatabase) + ".gone");
  first.store().TLClientSetValueForScalarKey("new", 2);
  EXPECT_EQ(Scalars(LinuxSubject(root).history()), (std::vector<Scalar>{{"new", kToday, 2}}));
}

TEST(LinuxCounterStore, KilledWritersLeaveWholeTransactions) {
  const TempRoot root;
  for (int round = 0; round < 20; ++round) {
    const pid_t child = Fork([&] {
      LinuxSubject subject(root);
      while (subject.ledger->inTransaction([&] {
        return subject.ledger->addToScalar("count", kToday, 40) &&
               subject.ledger->recordValues("d", kToday, Ramp(40));
      })) {
      }
      return 1;
    });
    usleep(static_cast<useconds_t>(2000 + 1500 * round));
    kill(child, SIGKILL);
    StatusOf(child);
    LinuxSubject reader(root, round % 2 == 0 ? Access::kReadOnly : Access::kReadWrite);
    const auto history = reader.history();
    const auto scalars = Scalars(history);
    const auto rows = Distributions(history);
    const auto values = rows.empty() ? 0 : std::ranges::count(rows[0], '@');
    EXPECT_EQ(scalars.empty() ? 0 : std::get<2>(scalars[0]), values);
  }
}

TEST(LinuxCounterStore, AReaderWithReadOnlyAccessLeavesNoTrace) {
  const TempRoot root;
  LinuxSubject reader(root, Access::kReadOnly);
  EXPECT_EQ(reader.history(), nullptr);
  EXPECT_EQ(root.list("/"), std::vector<std::string>{});
  Fill(root);
  // A writer that is killed after half of its pages were written.
  StatusOf(Fork([&] {
    RunSql(root.path(kDatabase),
           "PRAGMA cache_size = 1; BEGIN; UPDATE scalars SET value = 8;"
           "UPDATE blocks SET samples = zeroblob(length(samples))",
           true);
    return 0;
  }));
  ASSERT_GT(root.read(kDatabase + "-journal"s).size(), 512u);
  const auto before = Tree(root);
  for (const Access access : {Access::kReadOnly, Access::kReadWrite}) {
    LinuxSubject subject(root, access);
    const auto history = subject.history();
    EXPECT_EQ(Scalars(history), (std::vector<Scalar>{{"s", kToday, 7}}));
    EXPECT_EQ(Distributions(history, "e"), std::vector{Row("e", Ramp(3000))});
    EXPECT_EQ(Tree(root) == before, access == Access::kReadOnly);
  }
}

TEST(LinuxCounterStore, AFullDiskCostsOnlyWhatDidNotFit) {
  const TempRoot root;
  Fill(root);
  LinuxSubject subject(root);
  signal(SIGXFSZ, SIG_IGN);
  rlimit limit{};
  getrlimit(RLIMIT_FSIZE, &limit);
  rlimit small = limit;
  small.rlim_cur = root.read(kDatabase).size() + 4096;
  setrlimit(RLIMIT_FSIZE, &small);
  EXPECT_FALSE(subject.ledger->recordValues("d", kToday, Ramp(20000)));
  EXPECT_FALSE(subject.ledger->inTransaction([&] {
    const bool first = subject.ledger->recordValues("d", kToday, Ramp(900000));
    return subject.ledger->setScalar("s", kToday, 8) || !first;
  }));
  setrlimit(RLIMIT_FSIZE, &limit);
  EXPECT_EQ(subject.takeErrors(), 2u);
  subject.record("d", kToday, {});
  EXPECT_EQ(Scalars(subject.history()), (std::vector<Scalar>{{"s", kToday, 7}}));
  EXPECT_EQ(Distributions(subject.history(), "d"), std::vector{Row("d", Ramp(200))});
}

}  // namespace
}  // namespace quorlet
