// SPDX-License-Identifier: MIT
#include "model/PBCodable.h"

#include <cstdio>

namespace kolvrand {

std::string PBCodable::baseDescription() const {
  char address[32];
  std::snprintf(address, sizeof address, "%p", static_cast<const void*>(this));
  return std::string("<") + className() + ": " + address + ">";
}

std::string PBCodable::description() const {
  return baseDescription() + " " + dictionaryRepresentation().description();
}

std::vector<uint8_t> PBCodable::data() const {
  PBDataWriter writer;
  writeTo(writer);
  return writer.takeData();
}

}  // namespace kolvrand
