// SPDX-License-Identifier: MIT
#include <cstring>

#include "model/FieldEngine.h"
#include "model/PBCodable.h"

namespace kolvrand::detail {

namespace {

// Every element as its own fixed32 entry, the whole list in one append.
void writeList(const FieldDescriptor& d, const PBRepeatedFloat& list, PBDataWriter& writer) {
  const size_t n = list.size();
  if (n == 0) return;
  const size_t stride = d.tagSize + 4;
  uint8_t* out = writer.append(n * stride);
  const float* values = list.elements();
  if (d.tagSize == 1) {
    for (size_t i = 0; i < n; ++i, out += stride) {
      out[0] = d.tag[0];
      wire::storeFloat(out + 1, values[i]);
    }
  } else {
    for (size_t i = 0; i < n; ++i, out += stride) {
      std::memcpy(out, d.tag.data(), d.tagSize);
      wire::storeFloat(out + d.tagSize, values[i]);
    }
  }
}

}  // namespace

void writeFields(const MessageTable& table, ConstFields fields, PBDataWriter& writer) {
  for (const FieldDescriptor *d = table.fields, *end = d + table.count; d != end; ++d) {
    switch (d->kind) {
      case FieldKind::SubMessage:
        // Present with no content of its own still gives an entry of length 0.
        if (const auto& message = fields.subs[d->slot])
          PBDataWriterWriteSubmessage(writer, *message, d->number);
        break;
      case FieldKind::RepeatedFloat:
        writeList(*d, fields.lists[d->slot], writer);
        break;
      case FieldKind::Uint32:
        PBDataWriterWriteUint32Field(writer, fields.ints[d->slot], d->number);
        break;
      case FieldKind::OptionalFloat:
        if (fields.has & d->hasMask())
          PBDataWriterWriteFloatField(writer, fields.floats[d->slot], d->number);
        break;
      case FieldKind::OptionalEnum:
        if (fields.has & d->hasMask())
          PBDataWriterWriteInt32Field(writer, static_cast<int32_t>(fields.ints[d->slot]),
                                      d->number);
        break;
    }
  }
}

size_t encodedFieldsSize(const MessageTable& table, ConstFields fields) {
  size_t size = 0;
  for (const FieldDescriptor *d = table.fields, *end = d + table.count; d != end; ++d) {
    switch (d->kind) {
      case FieldKind::SubMessage:
        if (const auto& message = fields.subs[d->slot]) {
          const size_t length = message->encodedSize();
          size += d->tagSize + wire::varintSize(length) + length;
        }
        break;
      case FieldKind::RepeatedFloat:
        size += fields.lists[d->slot].size() * (d->tagSize + 4);
        break;
      case FieldKind::Uint32:
        size += d->tagSize + wire::varintSize(fields.ints[d->slot]);
        break;
      case FieldKind::OptionalFloat:
        if (fields.has & d->hasMask()) size += d->tagSize + 4;
        break;
      case FieldKind::OptionalEnum:
        if (fields.has & d->hasMask())
          size += d->tagSize +
                  wire::varintSize(wire::int32AsVarint(static_cast<int32_t>(fields.ints[d->slot])));
        break;
    }
  }
  return size;
}

}  // namespace kolvrand::detail
