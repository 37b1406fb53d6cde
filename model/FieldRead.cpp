#include <cstring>

#include "model/FieldEngine.h"
#include "model/PBCodable.h"

namespace kolvrand::detail {

namespace {

// A packed run; the reader's limit is narrowed to it. Whole floats are taken
// in one copy (the run's length was checked against the bytes that remain, so
// the list grows by at most remaining() / 4); a tail of 1 to 3 bytes appends
// 0.0 and sets the error flag.
void readPackedRun(PBDataReader& reader, PBRepeatedFloat& list) {
  const size_t whole = reader.remaining() / 4;
  list.appendLittleEndian(reader.cursor(), whole);
  reader.advance(whole * 4);
  if (!reader.isAtEnd()) list.add(reader.readFloat());
}

// Whether the `size` bytes at `p` are the tag bytes at `tag`. Field numbers
// below 2048 have one- or two-byte tags, compared without a memcmp call.
bool sameTag(const uint8_t* p, const uint8_t* tag, size_t size) {
  switch (size) {
    case 1:
      return p[0] == tag[0];
    case 2:
      return p[0] == tag[0] && p[1] == tag[1];
    default:
      return std::memcmp(p, tag, size) == 0;
  }
}

// One unpacked element, whose tag is the `tagSize` bytes at `tag`, then every
// directly following entry with the very same tag bytes: the usual shape of a
// list written unpacked. The run is counted first (only whole entries before
// the limit), so the list grows once and the dispatch loop is not re-entered
// per element.
void readUnpackedRun(PBDataReader& reader, PBRepeatedFloat& list, const uint8_t* tag,
                     size_t tagSize) {
  list.add(reader.readFloat());
  if (reader.hasError()) return;
  const size_t stride = tagSize + 4;
  const size_t fit = reader.remaining() / stride;
  const uint8_t* p = reader.cursor();
  size_t n = 0;
  while (n < fit && sameTag(p + n * stride, tag, tagSize)) ++n;
  list.appendStrided(p + tagSize, n, stride);
  reader.advance(n * stride);
}

}  // namespace

bool readFields(const MessageTable& table, MutableFields fields, PBDataReader& reader) {
  while (!reader.hasError() && !reader.isAtEnd()) {
    const size_t tagStart = reader.position();
    const uint64_t tag = reader.readVarint();
    if (reader.hasError()) break;
    const auto wireType = static_cast<uint8_t>(tag & 7);
    if (wireType == wire::kEndGroup) break;
    const auto number = static_cast<uint32_t>(tag >> 3);

    const FieldDescriptor* d = table.find(number);
    if (!d) {
      if (!PBReaderSkipValueWithTag(reader, number, wireType)) return false;
      continue;
    }
    switch (d->kind) {
      case FieldKind::SubMessage: {
        // A repeated occurrence replaces the earlier one instead of merging
        // into it, and the new instance is in place before its bytes are
        // checked, so a cut-off sub-message still reads as present.
        std::shared_ptr<PBCodable>& message = fields.subs[d->slot];
        message = d->makeMessage();
        PBDataReaderMark mark;
        if (!PBReaderPlaceMark(reader, mark)) return false;
        if (!message->readFrom(reader)) return false;
        // A sub-message that stopped at an end-group tag leaves the position
        // inside its run; reading goes on from there.
        PBReaderRecallMark(reader, mark);
        break;
      }
      case FieldKind::RepeatedFloat: {
        PBRepeatedFloat& list = fields.lists[d->slot];
        if (wireType == wire::kLengthDelimited) {
          PBDataReaderMark mark;
          if (!PBReaderPlaceMark(reader, mark)) return false;
          readPackedRun(reader, list);
          PBReaderRecallMark(reader, mark);
        } else {
          readUnpackedRun(reader, list, reader.bytes() + tagStart, reader.position() - tagStart);
        }
        break;
      }
      case FieldKind::Uint32:
        fields.ints[d->slot] = static_cast<uint32_t>(reader.readVarint());
        break;
      // The has-bit goes first: a value cut off by the limit leaves the field
      // present with 0.
      case FieldKind::OptionalFloat:
        *fields.has |= d->hasMask();
        fields.floats[d->slot] = reader.readFloat();
        break;
      case FieldKind::OptionalEnum:
        *fields.has |= d->hasMask();
        fields.ints[d->slot] = static_cast<uint32_t>(reader.readVarint());
        break;
    }
  }
  return !reader.hasError();
}

}  // namespace kolvrand::detail
