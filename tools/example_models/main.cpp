// SPDX-License-Identifier: MIT
// Writes the example model files: one per device type of the chem-ID table
// (chem ID 5640 in its "a" and "b" variants, two different cells) under
// OUT/models, and the one the example device loads under OUT/device/Library.
//
//   kolvrand-example-models EXAMPLES_DIR
#include <cstdio>
#include <filesystem>
#include <fstream>

#include "model/OTAParamRC.h"
#include "pipeline/PBStreamWriter.h"
#include "tools/example_models/ExampleModel.h"

namespace {

namespace fs = std::filesystem;

bool writeModel(const fs::path& path, uint32_t chemID, char variant) {
  std::shared_ptr<kolvrand::OTAParamRC> models[] = {kolvrand::makeExampleModel(chemID, variant)};
  std::vector<uint8_t> bytes = kolvrand::PBStreamWriter::dataForMessages(
      std::span<const std::shared_ptr<kolvrand::OTAParamRC>>(models));
  std::error_code ec;
  fs::create_directories(path.parent_path(), ec);
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  out.write(reinterpret_cast<const char*>(bytes.data()),
            static_cast<std::streamsize>(bytes.size()));
  out.close();
  if (!out) {
    std::fprintf(stderr, "kolvrand-example-models: cannot write %s\n", path.c_str());
    return false;
  }
  std::printf("%s (%zu bytes)\n", path.c_str(), bytes.size());
  return true;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 2) {
    std::fprintf(stderr, "usage: kolvrand-example-models EXAMPLES_DIR\n");
    return 2;
  }
  const fs::path out = argv[1];
  struct {
    const char* file;
    uint32_t chemID;
    char variant;
  } const models[] = {
      {"models/R71/1532.rcmodel", 0x1532, 0},
      {"models/R70/1552.rcmodel", 0x1552, 0},
      {"models/R72/1608a.rcmodel", 0x1608, 'a'},
      {"models/R72/1608b.rcmodel", 0x1608, 'b'},
      {"models/K517/1821.rcmodel", 0x1821, 0},
      {"models/T618e/2168.rcmodel", 0x2168, 0},
      {"models/T604/1886.rcmodel", 0x1886, 0},
      {"device/Library/KVR/BatteryModels/T618e/2168.rcmodel", 0x2168, 0},
  };
  bool ok = true;
  for (const auto& m : models) ok = writeModel(out / m.file, m.chemID, m.variant) && ok;
  return ok ? 0 : 1;
}
