// SPDX-License-Identifier: MIT
#include "model/PBDataWriter.h"

#include "model/PBCodable.h"

namespace kolvrand {

void PBDataWriterWriteFloatField(PBDataWriter& writer, float value, uint32_t fieldNumber) {
  writer.writeTag(fieldNumber, wire::kFixed32);
  writer.writeFloat(value);
}

void PBDataWriterWriteInt32Field(PBDataWriter& writer, int32_t value, uint32_t fieldNumber) {
  writer.writeTag(fieldNumber, wire::kVarint);
  writer.writeVarint(wire::int32AsVarint(value));
}

void PBDataWriterWriteUint32Field(PBDataWriter& writer, uint32_t value, uint32_t fieldNumber) {
  writer.writeTag(fieldNumber, wire::kVarint);
  writer.writeVarint(value);
}

void PBDataWriterWriteSubmessage(PBDataWriter& writer, const PBCodable& message,
                                 uint32_t fieldNumber) {
  writer.writeTag(fieldNumber, wire::kLengthDelimited);
  writer.writeVarint(message.encodedSize());
  message.writeTo(writer);
}

}  // namespace kolvrand
