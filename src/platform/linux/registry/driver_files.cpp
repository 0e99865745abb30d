#include "platform/linux/registry/driver_files.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/base/paths.h"
#include "platform/report_records.h"
#include "platform/storage_exports.h"
#include "values/byte_reader.h"
#include "values/byte_writer.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

constexpr std::size_t kMaxFiles = 4096;
// Of all files together.
constexpr std::size_t kMaxBytes = std::size_t{64} << 20;
constexpr std::size_t kMaxMemory = std::size_t{64} << 20;  // of what they say

// An integer as the 64 bits that drivers see: IDs may be written signed or unsigned.
std::optional<std::uint64_t> Bits(const PropertyValue* value) {
  const Number* number = value != nullptr ? value->asNumber() : nullptr;
  if (number == nullptr || number->isReal()) return std::nullopt;
  return number->kind() == NumberKind::kUInt64 ? number->toUInt64()
                                               : static_cast<std::uint64_t>(number->toInt64());
}
std::optional<std::uint64_t> BitsEntry(const Dictionary& dictionary, std::string_view key) {
  return Bits(dictionary.find(key));
}

KernelReturn StatusEntry(const Dictionary& dictionary, std::string_view key) {
  return static_cast<KernelReturn>(BitsEntry(dictionary, key).value_or(kKernelSuccess));
}

std::string TextEntry(const Dictionary& dictionary, std::string_view key) {
  const std::string* text = StringEntry(dictionary, key);
  return text != nullptr ? *text : std::string();
}

std::span<const std::byte> BytesEntry(const Dictionary& dictionary, std::string_view key) {
  const Data* data = DataEntry(dictionary, key);
  return data != nullptr ? std::span<const std::byte>(*data) : std::span<const std::byte>();
}

// The driver cuts what is longer than the caller's buffer.
void Answer(std::span<const std::byte> bytes, DriverCall& call) {
  call.bytesWritten = std::min(bytes.size(), call.structOutput.size());
  if (call.bytesWritten != 0) {
    std::memcpy(call.structOutput.data(), bytes.data(), call.bytesWritten);
  }
}

// Scalars are little-endian; the last one may be short.
void AnswerScalars(std::span<const std::byte> bytes, DriverCall& call) {
  while (!bytes.empty() && call.scalarsWritten < call.scalarOutput.size()) {
    const std::size_t length = std::min<std::size_t>(bytes.size(), 8);
    std::array<std::byte, 8> scalar{};
    std::memcpy(scalar.data(), bytes.data(), length);
    call.scalarOutput[call.scalarsWritten++] = ByteReader(scalar).little<std::uint64_t>();
    bytes = bytes.subspan(length);
  }
}

// Answers as the dictionary of the file says.
class FileDriver : public EntryDriver {
 public:
  explicit FileDriver(Dictionary description) : description_(std::move(description)) {}

  KernelReturn open(std::uint32_t) override { return StatusEntry(description_, "OpenStatus"); }
  KernelReturn close() override { return StatusEntry(description_, "CloseStatus"); }

  bool hasMethod(std::uint32_t method) const override {
    return isExportMethod(method) || findMethod(method) != nullptr;
  }

  KernelReturn call(std::uint32_t method, DriverCall& call) override {
    if (isExportMethod(method)) return callExport(call);
    const Dictionary* answer = findMethod(method);
    if (answer == nullptr) return kKernelUnsupported;
    const KernelReturn status = StatusEntry(*answer, "Status");
    if (status != kKernelSuccess) return status;
    const auto output = BytesEntry(*answer, "Output");
    Answer(output, call);
    if (call.structOutput.empty()) AnswerScalars(output, call);
    return kKernelSuccess;
  }

 private:
  bool isExportMethod(std::uint32_t method) const {
    const Array* methods = ArrayEntry(description_, "ExportMethods");
    return methods != nullptr && std::any_of(methods->begin(), methods->end(),
                                             [&](const auto& m) { return Bits(&m) == method; });
  }

  const Dictionary* findMethod(std::uint32_t method) const {
    const Dictionary* methods = DictionaryEntry(description_, "Methods");
    return methods != nullptr ? DictionaryEntry(*methods, std::to_string(method)) : nullptr;
  }

  const Dictionary* findExport(std::uint32_t selector, std::uint32_t listIndex) const {
    const Array* exports = ArrayEntry(description_, "Exports");
    if (exports == nullptr) return nullptr;
    for (const PropertyValue& item : *exports) {
      const Dictionary* candidate = item.asDictionary();
      if (candidate != nullptr && BitsEntry(*candidate, "Selector") == selector &&
          BitsEntry(*candidate, "ListIndex").value_or(0) == listIndex) {
        return candidate;
      }
    }
    return nullptr;
  }

  KernelReturn callExport(DriverCall& call) const {
    const auto request = ReadExportRequest(call.structInput);
    if (!request) return kKernelBadArgument;
    const Dictionary* found = findExport(request->selector, ListIndexOf(request->flags));
    if (found == nullptr) return kKernelNotFound;
    const auto data = BytesEntry(*found, "Data");
    if ((request->flags & kSizeOnlyFlag) == 0) {
      const KernelReturn status = StatusEntry(*found, "FetchStatus");
      if (status == kKernelSuccess) Answer(data, call);
      return status;
    }
    const KernelReturn status = StatusEntry(*found, "SizeStatus");
    if (status != kKernelSuccess) return status;
    const auto size = static_cast<std::uint32_t>(BitsEntry(*found, "Size").value_or(data.size()));
    std::array<std::byte, sizeof size> bytes;
    WriteLittle(size, bytes);
    if (call.structOutput.size() < bytes.size()) return kKernelBadArgument;
    Answer(bytes, call);
    return kKernelSuccess;
  }

  const Dictionary description_;
};

// About how much memory a value takes.
std::size_t Footprint(const PropertyValue& value) {
  constexpr std::size_t kMemberBytes = 64;  // of a dictionary, beside key and value
  std::size_t bytes = sizeof(PropertyValue);
  if (const std::string* text = value.asString()) bytes += text->size();
  if (const Data* data = value.asData()) bytes += data->size();
  if (const Array* array = value.asArray()) {
    for (const PropertyValue& element : *array) bytes += Footprint(element);
  }
  if (const Dictionary* dictionary = value.asDictionary()) {
    for (const auto& [key, member] : *dictionary) {
      bytes += kMemberBytes + key.size() + Footprint(member);
    }
  }
  return bytes;
}

struct DriverFile {
  std::size_t size = 0;
  std::size_t digest = 0;  // of its bytes; with the size, tells whether it has changed
  std::string problem;     // why there is no entry; empty where that has been told already
  std::optional<std::uint64_t> id;
  std::optional<RegistryEntry> entry;
  Dictionary description;     // with an entry
  std::size_t footprint = 0;  // of the description, also when it was not kept

  bool isOf(std::string_view text) const {
    return size == text.size() && digest == std::hash<std::string_view>()(text);
  }
  void drop(std::string why) {
    problem = std::move(why);
    entry.reset();
    description = Dictionary();
  }
};

DriverFile ReadDescription(std::string_view text) {
  DriverFile file;
  file.size = text.size();
  file.digest = std::hash<std::string_view>()(text);
  const auto document = ReadPropertyList(text);
  if (const auto* error = std::get_if<PropertyListError>(&document)) {
    file.problem = error->description;
    return file;
  }
  const Dictionary* description = std::get<PropertyValue>(document).asDictionary();
  if (description == nullptr) {
    file.problem = "it holds no dictionary";
    return file;
  }
  const auto id = BitsEntry(*description, "EntryID");
  if (!id) {
    file.problem = "it has no EntryID";
    return file;
  }
  // The invalid value is the ID of nothing: a channel with it could not be asked for.
  if (*id == std::uint64_t{1} << 63) {
    file.problem = "its EntryID is the invalid value";
    return file;
  }
  const Dictionary* properties = DictionaryEntry(*description, "Properties");
  file.id = *id;
  file.description = *description;
  file.footprint = Footprint(*description);
  file.entry = RegistryEntry{.id = *id,
                             .name = TextEntry(*description, "EntryName"),
                             .className = TextEntry(*description, "ClassName"),
                             .parentID = BitsEntry(*description, "ParentID"),
                             .properties = properties != nullptr ? *properties : Dictionary(),
                             .driver = std::make_shared<FileDriver>(*description),
                             .standsInFor = {}};
  return file;
}

class DriverFiles : public EntrySource {
 public:
  DriverFiles(const Root& root, SystemLog& log)
      : directory_(root.path(kDriversDirectory)), log_(log) {}

  std::vector<RegistryEntry> entries() override {
    read();
    std::vector<RegistryEntry> entries;
    for (const auto& [name, file] : files_) {
      if (file.entry) entries.push_back(*file.entry);
    }
    return entries;
  }

  std::string entrySet() override {
    if (const auto present = names()) {
      set_.clear();
      for (const std::string& name : *present) set_.append(name).append("/");
    }
    return set_;
  }

  void refreshElements() override { read(); }

  std::span<const std::byte> elements(std::uint64_t driverID, std::uint64_t channelID) override {
    const auto found = runs_.find({driverID, channelID});
    return found != runs_.end() ? found->second : std::span<const std::byte>();
  }

 private:
  struct Owner {
    std::string name;
    std::string duplicate;  // the first other file with the same ID
    std::size_t others = 0;
  };
  // A set of files while it is read.
  struct Reading {
    std::map<std::string, DriverFile> files;
    std::map<std::uint64_t, Owner> owners;
    bool isSame = true;  // as what was read before
    std::size_t room = kMaxBytes;
    std::size_t memory = kMaxMemory;
    std::size_t beyondMemory = 0;  // files that are
    std::string firstBeyondMemory;
  };

  // Nothing, after an error line, when the directory cannot be read.
  std::optional<std::vector<std::string>> names() {
    auto listed = ReadDirectory(directory_);
    const int* error = std::get_if<int>(&listed);
    if (error != nullptr) {
      if (*error != directoryError_) {
        log_.error("Cannot read %@: %@", directory_, ErrnoText(*error));
      }
      directoryError_ = *error;
      return std::nullopt;
    }
    directoryError_ = 0;
    auto& names = std::get<std::vector<std::string>>(listed);
    std::erase_if(names, [](const std::string& name) {
      return name.starts_with('.') || !name.ends_with(".plist");
    });
    return std::move(names);
  }

  // Reads every file; those whose bytes are the same are not parsed again. What was read before
  // stays while the directory cannot be read.
  void read() {
    const auto present = names();
    if (!present) return;
    Reading reading;
    for (const std::string& name : *present) {
      if (reading.files.size() == kMaxFiles) {
        reading.files[name].problem = "there are too many";
        reading.isSame = false;
        break;
      }
      readFile(name, reading);
    }
    const bool isSame = reading.isSame && files_.empty();  // what was not taken over has gone
    files_ = std::move(reading.files);
    if (isSame) return;
    for (const auto& [id, owner] : reading.owners) {
      if (owner.others == 0) continue;
      std::string& problem = files_[owner.duplicate].problem;
      problem = FormatText("its EntryID is that of %@", owner.name);
      if (owner.others > 1) problem += FormatText(", as with %u in all", owner.others);
    }
    if (reading.beyondMemory > 0) {
      files_[reading.firstBeyondMemory].problem =
          FormatText("there is no room for so many, %u in all", reading.beyondMemory);
    }
    report();
    indexRuns();
  }

  void readFile(const std::string& name, Reading& reading) {
    const auto bytes =
        ReadWholeFile(JoinPath(directory_, name), std::min(reading.room, kMaxPropertyListBytes));
    if (const int* error = std::get_if<int>(&bytes)) {
      if (*error == ENOENT) return;  // it has just gone
      reading.files[name].problem = ErrnoText(*error);
      reading.isSame = false;
      return;
    }
    const auto& text = std::get<std::string>(bytes);
    reading.room -= text.size();
    const auto known = files_.find(name);
    const bool isKnown = known != files_.end() && known->second.isOf(text);
    DriverFile file;
    if (isKnown) {
      file = std::move(known->second);
      files_.erase(known);
      // It was left out for another file's sake, which may have gone.
      const bool isWanted = file.id && !file.entry && !reading.owners.contains(*file.id) &&
                            file.footprint <= reading.memory;
      if (isWanted) file = ReadDescription(text);
    } else {
      file = ReadDescription(text);
      reading.isSame = false;
    }
    settle(name, file, reading);
    reading.files.emplace(name, std::move(file));
  }

  // Of files with one ID the first counts, and no more is kept than memory allows.
  static void settle(const std::string& name, DriverFile& file, Reading& reading) {
    if (!file.id) return;
    const auto owner = reading.owners.find(*file.id);
    if (owner != reading.owners.end()) {
      if (owner->second.others++ == 0) owner->second.duplicate = name;
      file.drop("");
    } else if (file.footprint > reading.memory) {
      if (reading.beyondMemory++ == 0) reading.firstBeyondMemory = name;
      file.drop("");
    } else {
      reading.memory -= file.footprint;
      reading.owners[*file.id].name = name;
    }
  }

  void report() {
    std::map<std::string, std::string> problems;
    for (const auto& [name, file] : files_) {
      if (file.problem.empty()) continue;
      const auto reported = reported_.find(name);
      if (reported == reported_.end() || reported->second != file.problem) {
        log_.error("Skipped the driver file %@: %@", JoinPath(directory_, name), file.problem);
      }
      problems.emplace(name, file.problem);
    }
    reported_ = std::move(problems);
  }

  void indexRuns() {
    runs_.clear();
    for (const auto& [name, file] : files_) {
      const Array* channels = file.entry ? ArrayEntry(file.description, "Channels") : nullptr;
      if (channels == nullptr) continue;
      for (const PropertyValue& item : *channels) {
        const Dictionary* channel = item.asDictionary();
        const auto id = channel != nullptr ? BitsEntry(*channel, "ChannelID") : std::nullopt;
        if (!id) continue;
        const auto bytes = BytesEntry(*channel, "Elements");
        const auto records = bytes.first(bytes.size() - bytes.size() % kRawElementSize);
        runs_.try_emplace({file.entry->id, *id}, records);
      }
    }
  }

  const std::string directory_;
  SystemLog& log_;
  int directoryError_ = 0;  // that was told of
  std::string set_;
  std::map<std::string, DriverFile> files_;  // by name
  std::map<std::string, std::string> reported_;
  std::map<std::pair<std::uint64_t, std::uint64_t>, std::span<const std::byte>> runs_;
};

}  // namespace

std::unique_ptr<EntrySource> MakeDriverFiles(const Root& root, SystemLog& log) {
  return std::make_unique<DriverFiles>(root, log);
}

}  // namespace quorlet
