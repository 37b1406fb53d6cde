// SPDX-License-Identifier: MIT
// The reverse-DNS name of the daemon: log subsystem, defaults suite, queue
// label and activity name all derive from it.
#pragma once

namespace kolvrand {

inline constexpr const char* DaemonIdentifier = "com.tesvar.kolvrand";

}  // namespace kolvrand
