// SPDX-License-Identifier: MIT
// Writes a model file: each message preceded by its length as a varint, the
// framing PBStreamReader reads.
#pragma once

#include <cstdint>
#include <memory>
#include <span>
#include <vector>

#include "model/PBDataWriter.h"

namespace kolvrand {

class PBStreamWriter {
 public:
  template <typename Message>
  static std::vector<uint8_t> dataForMessages(std::span<const std::shared_ptr<Message>> messages) {
    PBDataWriter writer;
    for (const auto& message : messages) {
      writer.writeVarint(message->encodedSize());
      message->writeTo(writer);
    }
    return writer.takeData();
  }
};

}  // namespace kolvrand
