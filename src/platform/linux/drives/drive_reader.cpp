#include "platform/linux/drives/drive_reader.h"

#include <array>

#include "platform/linux/base/kernel_text.h"
#include "platform/linux/drives/bounded_answer.h"
#include "platform/linux/drives/drive_figures.h"

namespace quorlet {
namespace {

using std::chrono::steady_clock;

constexpr std::chrono::seconds kLimit{2};
// What is asked for within this time is one look at the drive.
constexpr std::chrono::seconds kFresh{1};

std::string Attribute(const std::string& directory, std::string_view name) {
  return ReadKernelText(JoinPath(directory, name)).value_or("");
}

std::int64_t Identity(const std::string& model, const std::string& serial) {
  return serial.empty() ? 0 : static_cast<std::int64_t>(HashedID(model + "\n" + serial));
}

void ReadCard(const FoundDrive& found, Drive& drive) {
  const std::string device = found.directory + "/device";
  drive.model = CleanName(Attribute(device, "name"));
  drive.firmware = CleanName(Attribute(device, "fwrev"));
  drive.identity = Identity(drive.model, Attribute(device, "cid") + Attribute(device, "serial"));
  drive.answer = DriveAnswer::kNothingToTell;
  if (found.kind == DriveKind::kSd) return;
  const std::string lifeTime = Attribute(device, "life_time");
  const auto codes = Words(lifeTime);
  AddLifeTime(!codes.empty() ? codes[0] : "", codes.size() == 2 ? codes[1] : "",
              Attribute(device, "pre_eol_info"), drive.figures);
  drive.usedStep = kLifeTimeStep;
  // In KiB. A card without one has 0, or an error code as an unsigned number of 32 bits.
  const auto enhanced = ReadCounter(device + "/enhanced_area_size");
  if (enhanced && *enhanced != 0 && *enhanced < 0xFFFF'F000) {
    drive.figures.set(DriveFigure::kEnhancedArea, *enhanced * 1024);
  }
  if (!drive.figures.empty()) drive.answer = DriveAnswer::kTold;
}

void ReadSataDisk(const FoundDrive& found, Drive& drive) {
  const std::string device = found.directory + "/device";
  drive.model = CleanName(Attribute(device, "model"));
  drive.firmware = CleanName(Attribute(device, "rev"));
  drive.identity = Identity(drive.model, Attribute(device, "wwid"));
  drive.answer = DriveAnswer::kNothingToTell;
}

}  // namespace

std::vector<Drive> DriveReader::read() {
  std::vector<Drive> drives;
  for (const FoundDrive& found : find()) drives.push_back(read(found));
  return drives;
}

Drive DriveReader::read(const FoundDrive& found) {
  Drive drive;
  drive.place = found.place;
  drive.name = found.name;
  drive.kind = found.kind;
  drive.holdsRoot = found.holdsRoot;
  switch (found.kind) {
    case DriveKind::kNvme:
      readNvme(found, drive);
      break;
    case DriveKind::kEmmc:
    case DriveKind::kSd:
      ReadCard(found, drive);
      break;
    case DriveKind::kUfs:
      readUfs(found, drive);
      break;
    case DriveKind::kSata:
      ReadSataDisk(found, drive);
      break;
  }
  return drive;
}

const NvmePages& DriveReader::pages(const FoundDrive& drive) {
  const auto now = steady_clock::now();
  const auto known = asked_.find(drive.name);
  if (known != asked_.end() && (known->second.pages.isLate || now - known->second.when < kFresh)) {
    return known->second.pages;
  }
  NvmePages pages;
  if (IsAsleep(root_, drive)) {
    pages.answer = DriveAnswer::kAsleep;
  } else {
    pages = reader_(root_.path("/dev/" + drive.name), kLimit);
  }
  // The time limit itself is not part of how old the answer is.
  return asked_.insert_or_assign(drive.name, Asked{steady_clock::now(), std::move(pages)})
      .first->second.pages;
}

void DriveReader::readNvme(const FoundDrive& found, Drive& drive) {
  drive.model = CleanName(Attribute(found.directory, "model"));
  drive.firmware = CleanName(Attribute(found.directory, "firmware_rev"));
  drive.identity = Identity(drive.model, Attribute(found.directory, "serial"));
  const NvmePages& told = pages(found);
  drive.answer = told.answer;
  drive.error = told.error;
  AddNvmeHealth(told.health, drive.figures);
  AddNvmeDatacenter(told.datacenter, drive.figures);
  if (drive.answer == DriveAnswer::kTold && drive.figures.empty()) {
    drive.answer = DriveAnswer::kSilent;
  }
}

// Every attribute below is a question to the device, for which the kernel wakes it.
void DriveReader::readUfs(const FoundDrive& found, Drive& drive) {
  drive.usedStep = kLifeTimeStep;
  if (late_.contains(found.name)) return;
  const auto deadline = steady_clock::now() + kLimit;
  const auto ask = [&](const char* attribute) {
    if (IsAsleep(root_, found)) drive.answer = DriveAnswer::kAsleep;
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline - steady_clock::now());
    if (drive.answer == DriveAnswer::kAsleep || left.count() <= 0) return std::string();
    std::string text = ReadAttributeWithin(JoinPath(found.directory, attribute), left);
    text.resize(text.find_last_not_of(" \n") + 1);
    return text;
  };
  const std::string areaA = ask("health_descriptor/life_time_estimation_a");
  const std::string areaB = ask("health_descriptor/life_time_estimation_b");
  AddLifeTime(areaA, areaB, ask("health_descriptor/eol_info"), drive.figures);
  drive.model = CleanName(ask("string_descriptors/product_name"));
  drive.firmware = CleanName(ask("string_descriptors/product_revision"));
  drive.identity = Identity(drive.model, ask("string_descriptors/serial_number"));
  if (steady_clock::now() >= deadline) late_.insert(found.name);
  if (!drive.figures.empty()) {
    drive.answer = DriveAnswer::kTold;
  } else if (drive.answer != DriveAnswer::kAsleep && !areaA.empty()) {
    drive.answer = DriveAnswer::kNothingToTell;
  }
}

}  // namespace quorlet
