// Entries for journald over its native protocol: one datagram per entry on
// its socket, each field "KEY=VALUE" on a line of its own, or, for a value
// that holds a line feed, "KEY", a line feed, the value's length as a 64-bit
// little-endian number, the value and a line feed.
#pragma once

#include <span>
#include <string_view>

namespace kolvrand::platform {

inline constexpr const char* kJournalSocket = "/run/systemd/journal/socket";

// Sends one entry of `fields` (each "KEY=VALUE") to the datagram socket at
// `socketPath`; 0 on success, else a negative errno value (an entry too large
// for one datagram gives -EMSGSIZE; the caller writes it elsewhere).
int journalSend(std::span<const std::string_view> fields, const char* socketPath = kJournalSocket);

}  // namespace kolvrand::platform
