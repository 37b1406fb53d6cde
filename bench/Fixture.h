// SPDX-License-Identifier: MIT
// What every benchmark works on: the full-size example model in its two
// encodings, and the model file the example device loads.
#pragma once

#include <cstdint>
#include <filesystem>
#include <memory>
#include <span>
#include <string>
#include <vector>

namespace kolvrand {
class OTAParamRC;
}

namespace kolvrand::bench {

// The chem ID of the example device's model.
inline constexpr uint32_t kChemID = 0x2168;

// One encoded OTAParamRC, without the file's length prefix.
struct Encoding {
  std::vector<uint8_t> bytes;
  size_t floats = 0;  // list elements it carries
};

// As our writer writes it: every list element its own fixed32 entry. This is
// the body of the example model files.
const Encoding& unpackedModel();
// The same model with every list as one packed run (libprotobuf's encoding of
// the schema with [packed = true] on every list).
const Encoding& packedModel();
// The decoded model.
const std::shared_ptr<OTAParamRC>& referenceModel();

// The example device's model file in the source tree.
std::filesystem::path exampleModelFile();
// The example device in the source tree.
std::filesystem::path exampleDevice();

// A copy of the example device in a new temporary directory, without any
// state or driver output a run may have left there; removed on destruction.
class DeviceCopy {
 public:
  DeviceCopy();
  ~DeviceCopy();
  DeviceCopy(const DeviceCopy&) = delete;
  DeviceCopy& operator=(const DeviceCopy&) = delete;

  const std::filesystem::path& dir() const { return dir_; }
  // Its copy of the model file.
  std::filesystem::path modelFile() const;
  // Forgets the saved boot session, so the next task runs in full.
  void resetState() const;

 private:
  std::filesystem::path dir_;
};

// Aborts the benchmark run with a message: the fixture is not what the
// figures claim to measure.
[[noreturn]] void fail(const std::string& what);

}  // namespace kolvrand::bench
