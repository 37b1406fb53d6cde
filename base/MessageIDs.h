// SPDX-License-Identifier: MIT
// The journal's MESSAGE_ID of the daemon's key lines: with it, `journalctl -x`
// shows the catalog's explanation of the line (packaging/catalog).
#pragma once

#include <string_view>

namespace kolvrand {

// The 32 hex digits of the line's message ID; empty for a line without one.
// `message` is the formatted text, a trailing line feed allowed.
std::string_view messageIDFor(std::string_view message);

}  // namespace kolvrand
