#include "util/ReportingdUtil.h"

#include <algorithm>
#include <cstring>

#include <VeskReporting/VeskReportingKeys.h>
#include "platform/device/DeviceInformation.h"
#include "platform/unicode/Unicode.h"

namespace vesk {

namespace {

std::optional<Text> deviceFact(std::string_view key) {
  auto answer = QNCopyAnswer(key);
  return answer ? std::optional<Text>(*answer) : std::nullopt;
}

std::string lowercaseEntry(const Dictionary& dictionary, std::string_view key) {
  const Value* value = dictionary.find(key);
  const Text* text = value ? value->text() : nullptr;
  return text ? lowercase(text->view()) : std::string();
}

}  // namespace

std::optional<Text> deviceProductVersion() { return deviceFact("ProductVersion"); }
std::optional<Text> deviceBuildVersion() { return deviceFact("BuildVersion"); }
std::optional<Text> deviceProductType() { return deviceFact("ProductType"); }
std::optional<Text> deviceName() { return deviceFact("DeviceName"); }
std::optional<Text> deviceHardwareModel() { return deviceFact("HWModelStr"); }
std::optional<Text> deviceSerialNumber() { return deviceFact("SerialNumber"); }

void copyUniqueDeviceID(char* buffer, std::size_t size) {
  if (size == 0) return;
  auto identifier = QNCopyAnswer("UniqueDeviceID");
  if (!identifier) return;
  // A truncated identifier would be a different one.
  const std::size_t fitting = identifier->size() < size ? identifier->size() : 0;
  std::memcpy(buffer, identifier->data(), fitting);
  buffer[fitting] = '\0';
  buffer[size - 1] = '\0';
}

bool isInternalBuild() {
  static const bool isInternal = QNCopyAnswer("ReleaseType") == "Internal";
  return isInternal;
}

std::string correlationKeyForUserInfo(const Dictionary& userInfo) {
  return lowercaseEntry(userInfo, kVeskReportingUserInfoClientName) + ":" +
         lowercaseEntry(userInfo, kVeskReportingUserInfoServiceName);
}

double secondsFromTimeval(const timeval& time) noexcept {
  return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_usec) / 1'000'000.0;
}

}  // namespace vesk
