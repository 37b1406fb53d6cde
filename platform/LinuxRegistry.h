// SPDX-License-Identifier: MIT
// The registry of the Linux host: the drivers' devices in sysfs and the
// power-management driver's character device.
#pragma once

#include <memory>

#include "platform/Backend.h"
#include "platform/IOKit.h"

namespace kolvrand::platform {

std::unique_ptr<Registry> makeLinuxRegistry();

// The return code for what the kernel answered an open or a call with; the
// table is in the driver interface's ABI document.
IOReturn ioReturnFromErrno(int err);

}  // namespace kolvrand::platform
