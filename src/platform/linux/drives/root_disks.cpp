// Which disks the root's file system lies on: its device by /proc/self/mountinfo, a partition's
// disk, and what a disk is made of (slaves/).
#include <sys/stat.h>
#include <sys/sysmacros.h>

#include <algorithm>
#include <optional>

#include "platform/linux/base/kernel_text.h"
#include "platform/linux/drives/drive_list.h"

namespace quorlet {
namespace {

constexpr std::size_t kMaxMountBytes = std::size_t{4} << 20;
constexpr std::size_t kMaxDepth = 16;

struct Mount {
  std::string device;  // "major:minor"
  std::string point;
  std::string type;
  std::string source;
  std::string options;  // of the file system
};

// Blanks and backslashes of a field are written as \ooo.
std::string Unescape(std::string_view field) {
  std::string text;
  const auto isOctal = [&](std::size_t i) { return field[i] >= '0' && field[i] <= '7'; };
  for (std::size_t i = 0; i < field.size(); ++i) {
    if (field[i] == '\\' && field.size() - i > 3 && isOctal(i + 1) && isOctal(i + 2) &&
        isOctal(i + 3)) {
      const int code = (field[i + 1] - '0') * 64 + (field[i + 2] - '0') * 8 + (field[i + 3] - '0');
      text += static_cast<char>(code & 0xFF);
      i += 3;
    } else {
      text += field[i];
    }
  }
  return text;
}

// ID, parent, device, root, mount point, options, optional fields, "-", type, source, options.
std::optional<Mount> ParseMount(std::string_view line) {
  const auto words = Words(line);
  const auto dash = std::ranges::find(words, std::string_view("-"));
  if (dash - words.begin() < 6 || words.end() - dash < 4) return std::nullopt;
  return Mount{std::string(words[2]), Unescape(words[4]), std::string(dash[1]), Unescape(dash[2]),
               std::string(dash[3])};
}

std::vector<Mount> ReadMounts(const LoggingRoot& root) {
  std::vector<Mount> mounts;
  const auto text = ReadKernelText(root.kernelPath("/proc/self/mountinfo"), kMaxMountBytes);
  if (!text) return mounts;
  for (std::string_view rest = *text; !rest.empty();) {
    if (auto mount = ParseMount(TakeLine(rest))) mounts.push_back(*std::move(mount));
  }
  return mounts;
}

// The mount that `path` lies in; of several at one place, the last one covers the others.
const Mount* MountOf(const std::vector<Mount>& mounts, std::string_view path) {
  const Mount* best = nullptr;
  for (const Mount& mount : mounts) {
    const bool holds = mount.point == "/" || path == mount.point ||
                       (path.starts_with(mount.point) && path.size() > mount.point.size() &&
                        path[mount.point.size()] == '/');
    if (holds && (best == nullptr || mount.point.size() >= best->point.size())) best = &mount;
  }
  return best;
}

std::string UpperDirectory(std::string_view options) {
  constexpr std::string_view kUpper = "upperdir=";
  const std::size_t at = options.find(kUpper);
  if (at == std::string_view::npos) return {};
  options.remove_prefix(at + kUpper.size());
  return Unescape(options.substr(0, options.find(',')));
}

class DiskSearch {
 public:
  explicit DiskSearch(const LoggingRoot& root)
      : root_(root), blocks_(root.kernelPath("/sys/block")), names_(root.names(blocks_)) {}

  void addMount(const Mount& mount) {
    // A file system that has no device of its own, or several, has one of number 0:N.
    if (!mount.device.starts_with("0:")) return addNumber(mount.device);
    const std::string source = root_.path(mount.source);
    struct stat status = {};
    if (!mount.source.starts_with("/dev/")) return;
    if (stat(source.c_str(), &status) == 0 && S_ISBLK(status.st_mode)) {
      addNumber(std::to_string(major(status.st_rdev)) + ":" +
                std::to_string(minor(status.st_rdev)));
    } else {
      addName(mount.source.substr(mount.source.rfind('/') + 1), 0);
    }
  }

  std::set<std::string> take() { return std::move(found_); }

 private:
  // Of the disks and partitions: the disk that is, or has, one for which this holds.
  template <typename Condition>
  std::string diskWhere(const Condition& condition) const {
    for (const std::string& disk : names_) {
      const std::string directory = JoinPath(blocks_, disk);
      if (condition(disk, directory)) return disk;
      for (const std::string& part : root_.names(directory)) {
        if (part.starts_with(disk) && condition(part, JoinPath(directory, part))) return disk;
      }
    }
    return {};
  }

  void addNumber(const std::string& number) {
    addDisk(diskWhere([&](const std::string&, const std::string& directory) {
              return ReadKernelText(directory + "/dev") == number;
            }),
            0);
  }
  void addName(const std::string& name, std::size_t depth) {
    addDisk(diskWhere([&](const std::string& other, const std::string&) { return other == name; }),
            depth);
  }
  void addDisk(const std::string& disk, std::size_t depth) {
    if (disk.empty() || depth > kMaxDepth || !found_.insert(disk).second) return;
    for (const std::string& part : root_.names(blocks_ + "/" + disk + "/slaves")) {
      addName(part, depth + 1);
    }
  }

  const LoggingRoot root_;
  const std::string blocks_;
  const std::vector<std::string> names_;
  std::set<std::string> found_;
};

}  // namespace

std::set<std::string> RootDisks(const LoggingRoot& root) {
  const std::vector<Mount> mounts = ReadMounts(root);
  const Mount* mount = MountOf(mounts, "/");
  if (mount != nullptr && mount->type == "overlay") {
    const std::string upper = UpperDirectory(mount->options);
    mount = upper.empty() ? nullptr : MountOf(mounts, upper);
    // One whose directory lies in itself cannot be followed from inside.
    if (mount != nullptr && mount->type == "overlay") mount = nullptr;
  }
  DiskSearch search(root);
  if (mount != nullptr) search.addMount(*mount);
  return search.take();
}

}  // namespace quorlet
