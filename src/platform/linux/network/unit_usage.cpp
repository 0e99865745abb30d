#include "platform/linux/network/unit_usage.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <limits>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/network/bus_connection.h"
#include "platform/linux/network/network_links.h"
#include "platform/network_usage.h"
#include "values/text.h"

namespace quorlet {
namespace {

// The manager's own socket, which only root may use, answers faster than the way over the bus.
constexpr char kManagerSocket[] = "/run/systemd/private";
constexpr char kBusSocket[] = "/run/dbus/system_bus_socket";
constexpr std::string_view kManager = "org.freedesktop.systemd1";
constexpr std::string_view kProperties = "org.freedesktop.DBus.Properties";
constexpr std::string_view kUnitInterface = "org.freedesktop.systemd1.Unit";
constexpr std::string_view kServiceInterface = "org.freedesktop.systemd1.Service";
constexpr std::string_view kSuffix = ".service";

constexpr auto kNotCounted = std::numeric_limits<std::uint64_t>::max();
constexpr std::uint64_t kMicroseconds = 1'000'000;

struct Unit {
  std::string name;  // without the suffix
  std::string path;
  std::uint64_t inBytes = kNotCounted;
  std::uint64_t outBytes = kNotCounted;
  std::uint64_t startMicroseconds = 0;  // since 1970; 0 when it has not been started
};

// The services of a unit list, an array of structures of name, description, load state, active
// state, sub-state, followed unit, path, job number, job type and job path. nullopt when it is
// damaged.
std::optional<std::vector<Unit>> ParseUnits(std::string_view list) {
  BusReader reader(list);
  const std::size_t bytes = reader.number<std::uint32_t>();
  reader.align(8);
  const std::size_t end = reader.position() + bytes;
  std::vector<Unit> units;
  while (reader.ok() && reader.position() < end) {
    reader.align(8);
    const std::string_view name = reader.text();
    reader.text();
    reader.text();
    const std::string_view activeState = reader.text();
    reader.text();
    reader.text();
    const std::string_view path = reader.text();
    reader.number<std::uint32_t>();
    reader.text();
    reader.text();
    // While a service starts, its counts and its start may belong to different runs.
    const bool isSettled = activeState != "activating";
    if (isSettled && name.size() > kSuffix.size() && name.ends_with(kSuffix)) {
      const auto stem = name.substr(0, name.size() - kSuffix.size());
      units.push_back({.name = RepairUtf8(stem), .path = std::string(path)});
    }
  }
  if (!reader.ok() || reader.position() != end) return std::nullopt;
  return units;
}

// A variant that holds a u64; nullopt for anything else, as from a manager that does not count.
std::optional<std::uint64_t> ParseNumber(std::string_view variant) {
  BusReader reader(variant);
  const bool isNumber = reader.signature() == "t";
  const auto value = reader.number<std::uint64_t>();
  return reader.ok() && isNumber ? std::optional(value) : std::nullopt;
}

// Asks for one property of every unit; false when the manager does not answer.
bool ReadProperty(BusConnection& connection, std::vector<Unit>& units, std::string_view interface,
                  std::string_view property, std::uint64_t Unit::*member) {
  std::vector<BusCall> calls;
  for (const Unit& unit : units) {
    calls.push_back({kManager, unit.path, kProperties, "Get", {interface, property}});
  }
  const auto replies = connection.call(calls, "v");
  if (!replies) return false;
  for (std::size_t i = 0; i < units.size(); ++i) {
    units[i].*member = ParseNumber((*replies)[i]).value_or(units[i].*member);
  }
  return true;
}

constexpr std::string_view kNoManager = "org.freedesktop.DBus.Error.ServiceUnknown";

std::optional<std::vector<Unit>> ReadUnits(BusConnection& connection) {
  const BusCall list[] = {
      {kManager, "/org/freedesktop/systemd1", "org.freedesktop.systemd1.Manager", "ListUnits", {}}};
  const auto reply = connection.call(list, "a(ssssssouso)");
  if (!reply) return std::nullopt;
  // A bus without a manager has no services. Any other error is no answer: taken for an empty list,
  // it would wipe the counts that the next one is compared with.
  if (reply->front().empty() && connection.failure() == kNoManager) return std::vector<Unit>();
  auto units = ParseUnits(reply->front());
  if (!units ||
      !ReadProperty(connection, *units, kServiceInterface, "IPIngressBytes", &Unit::inBytes)) {
    return std::nullopt;
  }
  // Few units are counted as a rule, so only they are asked about further.
  std::erase_if(*units, [](const Unit& unit) { return unit.inBytes == kNotCounted; });
  if (!ReadProperty(connection, *units, kServiceInterface, "IPEgressBytes", &Unit::outBytes) ||
      !ReadProperty(connection, *units, kUnitInterface, "ActiveEnterTimestamp",
                    &Unit::startMicroseconds)) {
    return std::nullopt;
  }
  return units;
}

PropertyValue Count(std::uint64_t bytes) {
  constexpr auto kMax = std::numeric_limits<std::int64_t>::max();
  return Int64(static_cast<std::int64_t>(std::min<std::uint64_t>(bytes, kMax)));
}

Dictionary Record(const Unit& unit, LinkKind kind) {
  const bool isWifi = kind == LinkKind::kWifi;
  // Whole seconds: a date that is kept in a property list has no fractions, and must stay equal.
  const auto since = static_cast<double>(unit.startMicroseconds / kMicroseconds);
  return {
      {"procName", unit.name},
      {UsageSinceTimeKey, Date{since}},
      {"wifiInBytes", Count(isWifi ? unit.inBytes : 0)},
      {"wifiOutBytes", Count(isWifi ? unit.outBytes : 0)},
      {"wwanInBytes", Count(isWifi ? 0 : unit.inBytes)},
      {"wwanOutBytes", Count(isWifi ? 0 : unit.outBytes)},
  };
}

// Whether a manager can be asked through `connection`. On a bus that takes a greeting.
bool Connect(BusConnection& connection, const Root& root) {
  if (connection.connect(root.path(kManagerSocket))) return true;
  const BusCall hello[] = {
      {"org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus", "Hello", {}}};
  return connection.connect(root.path(kBusSocket)) && connection.call(hello, "s");
}

}  // namespace

std::optional<Array> ReadUnitUsage(const Root& root, std::chrono::milliseconds limit) {
  const auto deadline = std::chrono::steady_clock::now() + limit;
  const SoleLink link = SoleLinkKind(root);
  const auto* kind = std::get_if<std::optional<LinkKind>>(&link);
  if (kind == nullptr) return std::nullopt;
  if (!*kind) return Array();
  BusConnection connection(deadline);
  if (!Connect(connection, root)) {
    const bool isLate = std::chrono::steady_clock::now() >= deadline;
    return isLate ? std::nullopt : std::optional(Array());
  }
  const auto units = ReadUnits(connection);
  if (!units) return std::nullopt;
  Array records;
  for (const Unit& unit : *units) {
    if (unit.outBytes == kNotCounted || unit.startMicroseconds < kMicroseconds) continue;
    records.push_back(Record(unit, **kind));
  }
  return records;
}

}  // namespace quorlet
