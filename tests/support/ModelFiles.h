// SPDX-License-Identifier: MIT
// Model files made in tests.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "model/OTAParamRC.h"
#include "pipeline/PBStreamWriter.h"

namespace kolvrand::test {

inline std::string modelFile(const std::vector<std::shared_ptr<OTAParamRC>>& messages) {
  std::vector<uint8_t> bytes =
      PBStreamWriter::dataForMessages(std::span<const std::shared_ptr<OTAParamRC>>(messages));
  return std::string(bytes.begin(), bytes.end());
}

}  // namespace kolvrand::test
