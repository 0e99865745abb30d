// What scripts/bench-record compares the recording socket with, and what it sends.
//
//   record_peer sink SOCKET DATABASE     a bare loop: recvmmsg, sums by key, and once a second a
//                                        prepared upsert of each distinct key; ends after 2 s of
//                                        silence and prints the lines that it took
//   record_peer send SOCKET LINES PER_DATAGRAM KEYS TYPE    sends as fast as the receiver takes
#include <poll.h>
#include <sqlite3.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <array>
#include <charconv>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace {

using Steady = std::chrono::steady_clock;

struct Hash {
  using is_transparent = void;
  std::size_t operator()(std::string_view key) const { return std::hash<std::string_view>()(key); }
};
using Sums = std::unordered_map<std::string, std::int64_t, Hash, std::equal_to<>>;

[[noreturn]] void Fail(const char* what) {
  std::perror(what);
  std::exit(1);
}

int MakeSocket(const char* path, bool isReceiver) {
  const int made = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (std::strlen(path) >= sizeof address.sun_path) Fail("path");
  std::memcpy(address.sun_path, path, std::strlen(path));
  const auto* generic = reinterpret_cast<const sockaddr*>(&address);
  const int result =
      isReceiver ? bind(made, generic, sizeof address) : connect(made, generic, sizeof address);
  if (made < 0 || result != 0) Fail(path);
  return made;
}

void Commit(sqlite3* database, sqlite3_stmt* upsert, Sums& sums) {
  sqlite3_exec(database, "BEGIN IMMEDIATE", nullptr, nullptr, nullptr);
  for (const auto& [key, sum] : sums) {
    sqlite3_bind_blob(upsert, 1, key.data(), static_cast<int>(key.size()), SQLITE_STATIC);
    sqlite3_bind_int64(upsert, 2, sum);
    if (sqlite3_step(upsert) != SQLITE_DONE) Fail("upsert");
    sqlite3_reset(upsert);
  }
  if (sqlite3_exec(database, "COMMIT", nullptr, nullptr, nullptr) != SQLITE_OK) Fail("commit");
  sums.clear();
}

std::size_t AddLines(std::string_view text, Sums& sums) {
  std::size_t lines = 0;
  while (!text.empty()) {
    const std::string_view line = text.substr(0, text.find('\n'));
    text.remove_prefix(std::min(text.size(), line.size() + 1));
    const std::size_t colon = line.find(':');
    std::int64_t value = 0;
    std::from_chars(line.data() + colon + 1, line.data() + line.size(), value);
    const std::string_view key = line.substr(0, colon);
    const auto found = sums.find(key);
    if (found != sums.end()) {
      found->second += value;
    } else {
      sums.emplace(key, value);
    }
    ++lines;
  }
  return lines;
}

int Sink(const char* path, const char* file) {
  constexpr std::size_t kAtOnce = 16, kSize = 65536;
  const int receiver = MakeSocket(path, true);
  sqlite3* database = nullptr;
  sqlite3_stmt* upsert = nullptr;
  sqlite3_open(file, &database);
  sqlite3_exec(database,
               "PRAGMA journal_mode = WAL; PRAGMA synchronous = FULL;"
               "CREATE TABLE sums(key BLOB PRIMARY KEY, value INTEGER) WITHOUT ROWID",
               nullptr, nullptr, nullptr);
  sqlite3_prepare_v2(database,
                     "INSERT INTO sums VALUES(?1, ?2)"
                     " ON CONFLICT(key) DO UPDATE SET value = value + ?2",
                     -1, &upsert, nullptr);
  if (upsert == nullptr) Fail(file);
  std::vector<char> texts(kAtOnce * kSize);
  std::array<iovec, kAtOnce> places{};
  std::array<mmsghdr, kAtOnce> messages{};
  Sums sums;
  std::size_t lines = 0;
  auto nextCommit = Steady::now() + std::chrono::seconds(1);
  while (true) {
    pollfd waited = {receiver, POLLIN, 0};
    const int ready = poll(&waited, 1, 2000);
    for (std::size_t i = 0; i < kAtOnce; ++i) {
      places[i] = {texts.data() + i * kSize, kSize};
      messages[i].msg_hdr = {};
      messages[i].msg_hdr.msg_iov = &places[i];
      messages[i].msg_hdr.msg_iovlen = 1;
    }
    const int count = recvmmsg(receiver, messages.data(), kAtOnce, MSG_DONTWAIT, nullptr);
    for (int i = 0; i < count; ++i) {
      const auto at = static_cast<std::size_t>(i);
      lines += AddLines({texts.data() + at * kSize, messages[at].msg_len}, sums);
    }
    if (ready == 0 || Steady::now() >= nextCommit) {
      Commit(database, upsert, sums);
      nextCommit = Steady::now() + std::chrono::seconds(1);
    }
    if (ready == 0) break;
  }
  sqlite3_finalize(upsert);
  sqlite3_close(database);
  unlink(path);
  std::printf("%zu\n", lines);
  return 0;
}

int Send(char** words) {
  const int sender = MakeSocket(words[0], false);
  const auto lines = std::strtoull(words[1], nullptr, 10);
  const auto perDatagram = std::strtoull(words[2], nullptr, 10);
  const auto keys = std::strtoull(words[3], nullptr, 10);
  // Made beforehand: what is timed is the receiver.
  std::vector<std::string> datagrams(keys);
  std::size_t key = 0;
  for (std::string& datagram : datagrams) {
    for (std::size_t i = 0; i < perDatagram; ++i) {
      datagram += "service.requests." + std::to_string(key++ % keys) + ":1|" + words[4];
      if (i + 1 < perDatagram) datagram += '\n';
    }
  }
  for (std::size_t sent = 0; sent * perDatagram < lines; ++sent) {
    const std::string& datagram = datagrams[sent % datagrams.size()];
    if (send(sender, datagram.data(), datagram.size(), 0) < 0) Fail("send");
  }
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  const std::string_view mode = argc > 1 ? argv[1] : "";
  if (mode == "sink" && argc == 4) return Sink(argv[2], argv[3]);
  if (mode == "send" && argc == 7) return Send(argv + 2);
  std::fputs("see the comment at the top of record_peer.cpp\n", stderr);
  return 2;
}
