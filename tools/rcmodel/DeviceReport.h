// SPDX-License-Identifier: MIT
// What rcmodel status and rcmodel upload both say about the device in use:
// which drivers are there, the chem ID as the battery reports it and as the
// daemon uses it, the hash the driver publishes, one report line.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "base/Value.h"
#include "pipeline/BatteryModelDataHandler.h"

namespace kolvrand::rcmodel {

// "this host" or "simulated device DIR".
std::string deviceName();

// A handler of the daemon's code without the daemon's settings: its chem-ID
// read stores nothing, so rcmodel never writes what the daemon keeps.
std::shared_ptr<BatteryModelDataHandler> handlerWithoutSettings();

// Whether a registry service stands for the battery driver (TesvarSmartBattery)
// and for the power-management driver (TesvarKVR).
bool batteryDriverFound();
bool powerDriverFound();

// The chem ID the daemon uses, and beside it the one the battery reports when
// the daemon reads that as another: "0x2168 (8552), the battery reports 0x1927 (6439)".
std::string chemIDText(BatteryModelDataHandler& handler, uint32_t chemID);

// The hash the driver publishes under KVRVector / KVRBatteryModel / RCParamsHash.
std::optional<Data> publishedHash(BatteryModelDataHandler& handler);

// One "KEY:   VALUE" line of a report; the value is shown as visibleText shows
// it, since it comes from the device (a target type, a path, a logged line).
void reportLine(const char* key, const std::string& value);

// The one line given when the power-management driver refuses rcmodel access
// to its node.
inline constexpr const char* kNoAccess =
    "no access to the power-management driver's node: run as root or as a member of the "
    "group that owns it (kolvrand for /dev/tesvar_kvr)";

}  // namespace kolvrand::rcmodel
