// SPDX-License-Identifier: MIT
// Device type: the family whose battery models apply, from the chem-ID table,
// else the hardware target type the kernel reports.
#include <algorithm>
#include <array>
#include <cstring>

#include "base/Utf8.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "platform/Sysctl.h"

namespace kolvrand {

namespace {

struct ChemIDDeviceType {
  uint32_t chemID;
  const char* deviceType;
};

// Sorted by chem ID; exact matches only.
constexpr std::array<ChemIDDeviceType, 18> kDeviceTypes{{
    {5426, "R71"},
    {5458, "R70"},
    {5638, "R70"},
    {5639, "R72"},
    {5640, "R72"},
    {5648, "R72"},
    {5649, "R72"},
    {5689, "R70"},
    {6177, "K517"},
    {6201, "T618e"},
    {6249, "K517"},
    {6259, "K517"},
    {6278, "T604"},
    {6408, "T618e"},
    {6436, "T618e"},
    {6439, "T618e"},
    {6489, "T604"},
    {8552, "T618e"},
}};
static_assert(std::is_sorted(kDeviceTypes.begin(), kDeviceTypes.end(),
                             [](auto& a, auto& b) { return a.chemID < b.chemID; }));

}  // namespace

std::optional<std::string> BatteryModelDataHandler::getDeviceType(uint32_t chemID) {
  auto row = std::lower_bound(kDeviceTypes.begin(), kDeviceTypes.end(), chemID,
                              [](const ChemIDDeviceType& r, uint32_t id) { return r.chemID < id; });
  if (row != kDeviceTypes.end() && row->chemID == chemID) return row->deviceType;

  size_t size = 0;
  int err = sysctlbyname("hw.targettype", nullptr, &size, nullptr, 0);
  if (err != 0) {
    os_log_error(log_, "hw.targettype size could not be read. Returned err %d\n", err);
    return std::nullopt;
  }
  std::unique_ptr<char[]> buffer = allocateKernelStringBuffer(size);
  // A size that cannot be had fails like the read itself.
  err = buffer ? sysctlbyname("hw.targettype", buffer.get(), &size, nullptr, 0) : -1;
  if (err != 0) {
    os_log_error(log_, "Failed to read hw.targettype. Returned err %d\n", err);
    return std::nullopt;
  }
  const char* text = buffer.get();
  os_log_debug(log_, "Read HW type %s\n", text);
  return stringWithUTF8String(text);
}

}  // namespace kolvrand
