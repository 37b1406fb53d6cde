// SPDX-License-Identifier: MIT
#include "model/PBDataReader.h"

namespace kolvrand {

namespace {

// Moves past `n` bytes, or sets the error flag when fewer remain.
bool skipBytes(PBDataReader& reader, uint64_t n) {
  if (n > reader.remaining()) {
    reader.setError();
    return false;
  }
  reader.advance(static_cast<size_t>(n));
  return true;
}

}  // namespace

bool PBReaderSkipValueWithTag(PBDataReader& reader, uint32_t fieldNumber, uint8_t wireType) {
  // Groups are walked with an explicit stack of open field numbers rather than
  // by recursion, so hostile nesting costs a bounded array, not the C++ stack.
  uint32_t openGroups[kMaxGroupDepth];
  size_t depth = 0;
  for (;;) {
    switch (wireType) {
      case wire::kVarint:
        reader.readVarint();
        if (reader.hasError()) return false;
        break;
      case wire::kFixed64:
        if (!skipBytes(reader, 8)) return false;
        break;
      case wire::kLengthDelimited: {
        const uint64_t length = reader.readVarint();
        if (reader.hasError() || !skipBytes(reader, length)) return false;
        break;
      }
      case wire::kStartGroup:
        if (depth == kMaxGroupDepth) return false;
        openGroups[depth++] = fieldNumber;
        break;
      case wire::kEndGroup:
        if (depth == 0 || openGroups[depth - 1] != fieldNumber) return false;
        --depth;
        break;
      case wire::kFixed32:
        if (!skipBytes(reader, 4)) return false;
        break;
      default:
        if (reader.observer()) reader.observer()->noSuchWireType(wireType);
        return false;
    }
    if (depth == 0) return true;
    const size_t tagStart = reader.position();
    const uint64_t tag = reader.readVarint();
    if (reader.hasError()) return false;
    if (reader.observer()) reader.observer()->tag(tagStart, tag, reader.position() - tagStart);
    fieldNumber = static_cast<uint32_t>(tag >> 3);
    wireType = static_cast<uint8_t>(tag & 7);
  }
}

}  // namespace kolvrand
