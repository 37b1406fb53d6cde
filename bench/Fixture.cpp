// SPDX-License-Identifier: MIT
#include "bench/Fixture.h"

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iterator>

#include "bench_packed.pb.h"
#include "model/OTAParamRC.h"
#include "model/PBDataReader.h"
#include "tools/example_models/ExampleModel.h"

namespace kolvrand::bench {

namespace fs = std::filesystem;

namespace {

size_t listElements(const OTAParamRC& m) {
  size_t n = m.agingCoeffForR0sCount() + m.agingCoeffForR0TemperatureCoeffsCount() +
             m.agingCoeffForR1sCount() + m.agingCoeffForR1TemperatureCoeffsCount() +
             m.agingCoeffForR2sCount() + m.agingCoeffForR2TemperatureCoeffsCount() +
             m.agingCoeffForR3sCount() + m.agingCoeffForR3TemperatureCoeffsCount() +
             m.agingCoeffForRCFreq1sCount() + m.agingCoeffForRCFreq2sCount() +
             m.agingCoeffForRCFreq3sCount() + m.agingCoeffForRCFreq4sCount() +
             m.agingCoeffForRCFreq1TemperatureCoeffsCount() +
             m.agingCoeffForRCFreq2TemperatureCoeffsCount() +
             m.agingCoeffForRCFreq3TemperatureCoeffsCount() +
             m.agingCoeffForRCFreq4TemperatureCoeffsCount() + m.baselineRdcsCount() +
             m.gridOCVsCount() + m.slopeForR0ExtrapsCount() + m.slopeForR1ExtrapsCount() +
             m.slopeForR2ExtrapsCount() + m.slopeForR3ExtrapsCount();
  for (const auto& t :
       {m.r0(), m.r1(), m.r2(), m.r3(), m.rCFreq1(), m.rCFreq2(), m.rCFreq3(), m.rCFreq4(),
        m.baselineR0(), m.baselineR1(), m.baselineR2(), m.baselineR3(), m.baselineR4(),
        m.baselineRCFreq1(), m.baselineRCFreq2(), m.baselineRCFreq3(), m.baselineRCFreq4()}) {
    if (t) n += t->resistance25CsCount() + t->temperatureCoeffsCount();
  }
  return n;
}

// Decodes `bytes` with our reader and checks that it gives the reference model.
void checkDecodes(const std::vector<uint8_t>& bytes, const char* what) {
  OTAParamRC decoded;
  PBDataReader reader(bytes.data(), bytes.size());
  if (!decoded.readFrom(reader) || !decoded.isEqual(referenceModel().get()))
    fail(std::string("the ") + what + " encoding does not decode to the example model");
}

std::vector<uint8_t> readWholeFile(const fs::path& path) {
  std::ifstream in(path, std::ios::binary);
  if (!in) fail("cannot read " + path.string());
  return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

}  // namespace

void fail(const std::string& what) {
  std::fprintf(stderr, "kolvrand_bench: %s\n", what.c_str());
  std::exit(1);
}

const std::shared_ptr<OTAParamRC>& referenceModel() {
  static const std::shared_ptr<OTAParamRC> model = makeExampleModel(kChemID);
  return model;
}

const Encoding& unpackedModel() {
  static const Encoding encoding = [] {
    Encoding e{referenceModel()->data(), listElements(*referenceModel())};
    // The model file is this body behind its varint length.
    std::vector<uint8_t> file = readWholeFile(exampleModelFile());
    size_t prefix = 0;
    while (prefix < file.size() && (file[prefix++] & 0x80)) {
    }
    if (!std::equal(file.begin() + static_cast<std::ptrdiff_t>(prefix), file.end(), e.bytes.begin(),
                    e.bytes.end()))
      fail(exampleModelFile().string() + " is not the generator's model; regenerate it");
    checkDecodes(e.bytes, "unpacked");
    return e;
  }();
  return encoding;
}

const Encoding& packedModel() {
  static const Encoding encoding = [] {
    const std::vector<uint8_t>& plain = unpackedModel().bytes;
    kolvrand_libprotobuf_packed::OTAParamRC message;
    if (!message.ParseFromArray(plain.data(), static_cast<int>(plain.size())))
      fail("libprotobuf cannot parse the example model");
    std::string packed;
    if (!message.SerializeToString(&packed)) fail("libprotobuf cannot write the packed model");
    Encoding e{std::vector<uint8_t>(packed.begin(), packed.end()), unpackedModel().floats};
    checkDecodes(e.bytes, "packed");
    return e;
  }();
  return encoding;
}

namespace {
const fs::path kModelInDevice =
    fs::path("Library") / "KVR" / "BatteryModels" / "T618e" / "2168.rcmodel";
}

fs::path exampleDevice() {
  return fs::path(KOLVRAND_SOURCE_DIR) / "examples" / "device";
}

fs::path exampleModelFile() {
  return exampleDevice() / kModelInDevice;
}

fs::path DeviceCopy::modelFile() const {
  return dir_ / kModelInDevice;
}

DeviceCopy::DeviceCopy() {
  std::string pattern = (fs::temp_directory_path() / "kolvrand-bench.XXXXXX").string();
  if (!mkdtemp(pattern.data())) fail("cannot make a temporary directory");
  dir_ = pattern;
  std::error_code ec;
  fs::copy(exampleDevice(), dir_, fs::copy_options::recursive, ec);
  if (ec) fail("cannot copy the example device: " + ec.message());
  fs::remove_all(dir_ / "driver", ec);
  resetState();
}

DeviceCopy::~DeviceCopy() {
  std::error_code ec;
  fs::remove_all(dir_, ec);
}

void DeviceCopy::resetState() const {
  std::error_code ec;
  fs::remove_all(dir_ / "state", ec);
}

}  // namespace kolvrand::bench
