// SPDX-License-Identifier: MIT
// The whole transfer on simulated devices, through the boot-session gate: for
// each way it can fail, the exact chain of lines (innermost first), what the
// driver holds afterwards and that "savedBootUUID" is untouched.
#include <gtest/gtest.h>

#include <map>

#include "daemon/BatteryModelTask.h"
#include "model/OTAParamRC.h"
#include "pipeline/DaemonIdentifier.h"
#include "pipeline/KextBatteryModel.h"
#include "tests/support/TestDevice.h"
#include "tools/example_models/ExampleModel.h"

namespace kolvrand {
namespace {

namespace fs = std::filesystem;
using Lines = std::vector<std::string>;
using nlohmann::json;

// The chains are the log an operator reads, so they live verbatim in
// transfer_chains.json: per case the lines, the device.json patch, what the
// driver publishes as "KVRVector" when the case says (null: the driver's
// "none"; left out, the simulated driver publishes the hash of what it holds),
// and the model file at T618e/2168.rcmodel. "@" stands for its full path. The
// hashes there are made from the example record's SHA-1, which
// KextBatteryModelTest pins.
TEST(Transfer, EachOutcomeLeavesItsChainTheDriverAndTheMark) {
  const auto model = makeExampleModel(0x2168);
  const std::string example = test::modelFile({model});
  auto tooShort = model->copy();
  tooShort->setGridOCVs(model->gridOCVs(), 300);
  tooShort->setR2(nullptr);
  const std::map<std::string, std::optional<std::string>> files = {
      {"example", example},
      {"example then another", example + test::modelFile({makeExampleModel(0x1821)})},
      {"none", std::nullopt},
      {"cut short", std::string("\x05\x90\x01", 3)},
      {"empty", ""},
      {"too short", test::modelFile({tooShort})},
  };
  const auto built = BatteryModelDataHandler().createKextModelFromProtobufModel(model.get());
  const std::string record(reinterpret_cast<const char*>(built.get()), sizeof *built);
  const json cases =
      json::parse(test::readFile(KOLVRAND_SOURCE_DIR "/tests/pipeline/transfer_chains.json"));
  ASSERT_EQ(cases.size(), 20u);
  for (const json& c : cases) {
    SCOPED_TRACE(c["case"].get<std::string>());
    json j = test::defaultDeviceJSON();
    j.merge_patch(c.value("device", json::object()));
    if (c.contains("KVRVector")) j["registry"]["TesvarKVR"]["KVRVector"] = c["KVRVector"];
    test::TestDevice device(j);
    const fs::path path = device.dir() / "Library/KVR/BatteryModels/T618e/2168.rcmodel";
    if (const auto& file = files.at(c.value("model", "example")))
      device.installModel("T618e/2168.rcmodel", *file);
    test::writeFile(device.statePath(), R"({"savedBootUUID": "previous-session"})");
    device.clearLog();
    runBatteryModelTask(os_log_create(DaemonIdentifier, "main"),
                        BatteryModelDataHandler::init().get());
    Lines expected = c["lines"];
    for (std::string& line : expected)
      if (auto at = line.find('@'); at != std::string::npos) line.replace(at, 1, path.string());
    EXPECT_EQ(device.logLines(), expected);
    const bool succeeded = expected.back() == "default [main] Battery data upload succeeded";
    EXPECT_EQ(device.state()["savedBootUUID"],
              succeeded ? "11111111-2222-3333-4444-555555555555" : "previous-session");
    // The driver holds the record it accepted, even when the verification
    // failed afterwards, and nothing else.
    const bool accepted = succeeded || c.contains("KVRVector");
    EXPECT_TRUE(test::readFile(device.dir() / "driver/battery_params.bin") ==
                (accepted ? record : ""))
        << "the driver holds another record";
  }
}

// The two steps the transfer never hands nil (the chains above cross the
// other two) refuse it all the same, each with its line.
TEST(Transfer, NilInputsAreRefused) {
  test::TestDevice device;
  auto handler = BatteryModelDataHandler::init();
  EXPECT_FALSE(handler->loadProtobufModelWithFileName(std::nullopt));
  EXPECT_EQ(handler->getIntValueForKeyFromBatteryData(nullptr), 0);
  const std::string h = "error [batteryModelDataHandling] -[BatteryModelDataHandler ";
  EXPECT_EQ(device.logLines(), (Lines{h + "loadProtobufModelWithFileName:] <Error> fileName nil",
                                      h + "getIntValueForKeyFromBatteryData:] <Error> key null"}));
}

}  // namespace
}  // namespace kolvrand
