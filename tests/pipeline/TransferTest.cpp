// The whole transfer on simulated devices, through the boot-session gate: for
// each way it can fail, the exact chain of lines (innermost first), what the
// driver holds afterwards and that "savedBootUUID" is untouched.
#include <gtest/gtest.h>

#include <fstream>

#include "daemon/BatteryModelTask.h"
#include "model/OTAParamRC.h"
#include "pipeline/DaemonIdentifier.h"
#include "pipeline/KextBatteryModel.h"
#include "platform/CommonCrypto.h"
#include "tests/support/ModelFiles.h"
#include "tests/support/TestDevice.h"
#include "tools/example_models/ExampleModel.h"

namespace kolvrand {
namespace {

namespace fs = std::filesystem;
using Lines = std::vector<std::string>;
using nlohmann::json;

constexpr const char* kModelPath = "T618e/2168.rcmodel";

std::string handlerError(const std::string& method, const std::string& text) {
  return "error [batteryModelDataHandling] -[BatteryModelDataHandler " + method + "] <Error> " +
         text;
}
const std::string kMove = "moveBatteryModelDataFromDiskToKext:";
const std::string kUpload = "setBatteryModelDataToKernel:";
const std::string kVerify = "verifyHashData:";
const std::string kStart = "debug [main] Battery data upload run for chemId 0x2168";
const std::string kFailed = "error [main] Battery data upload failed";

std::string resourceLine(const test::TestDevice& device, const std::string& relative) {
  return "debug [batteryModelDataHandling] -[BatteryModelDataHandler "
         "getBatteryModelFileURLString:] workingDirURL resource: " +
         (device.dir() / "Library/KVR/BatteryModels" / relative).string() + " ";
}

// The record the daemon sends for `model`, as bytes.
std::string recordBytes(const OTAParamRC& model) {
  auto record = BatteryModelDataHandler::init()->createKextModelFromProtobufModel(&model);
  return record ? std::string(reinterpret_cast<const char*>(record.get()), sizeof *record) : "";
}

std::string hex(const std::string& bytes) {
  return hexString(reinterpret_cast<const uint8_t*>(bytes.data()), bytes.size());
}

std::string fileContents(const fs::path& path) {
  std::ifstream in(path, std::ios::binary);
  return std::string(std::istreambuf_iterator<char>(in), {});
}

class Transfer : public ::testing::Test {
 protected:
  // Runs one start of the daemon's task on `device` after seeding the previous
  // session's mark, and checks the mark afterwards.
  Lines start(test::TestDevice& device, bool expectSuccess) {
    device.reload();
    writePreviousSession(device);
    device.clearLog();
    runBatteryModelTask(os_log_create(DaemonIdentifier, "main"),
                        BatteryModelDataHandler::init().get());
    EXPECT_EQ(device.state()["savedBootUUID"],
              expectSuccess ? "11111111-2222-3333-4444-555555555555" : "previous-session");
    return device.logLines();
  }
  static void writePreviousSession(const test::TestDevice& device) {
    fs::create_directories(device.statePath().parent_path());
    std::ofstream(device.statePath()) << R"({"savedBootUUID": "previous-session"})";
  }
  std::shared_ptr<OTAParamRC> model_ = makeExampleModel(0x2168);
};

TEST_F(Transfer, SuccessLeavesExactlyTheRecordInTheDriver) {
  test::TestDevice device;
  device.installModel(kModelPath, test::modelFile({model_}));
  Lines lines = start(device, true);
  EXPECT_EQ(lines, (Lines{kStart, resourceLine(device, kModelPath),
                          "default [main] Battery data upload succeeded"}));
  std::string kept = fileContents(device.dir() / "driver/battery_params.bin");
  EXPECT_EQ(kept.size(), kKextBatteryModelSize);
  EXPECT_TRUE(kept == recordBytes(*model_)) << "the driver holds another record";
}

TEST_F(Transfer, EachStageFailureLeavesItsChain) {
  struct Case {
    const char* name;
    std::function<void(test::TestDevice&, json&)> arrange;
    std::function<Lines(const test::TestDevice&)> chain;  // all lines before the last
    bool uploaded;
  };
  const std::string model = test::modelFile({model_});
  const Case cases[] = {
      {"no device type",
       [](test::TestDevice&, json& j) {
         j["registry"]["TesvarSmartBattery"]["BatteryData"]["AlgoChemID"] = 1234;
         j["sysctl"].erase("hw.targettype");
       },
       [](const test::TestDevice&) {
         return Lines{
             "debug [main] Battery data upload run for chemId 0x4d2",
             "error [batteryModelDataHandling] hw.targettype size could not be read. Returned "
             "err -1",
             handlerError("getBatteryModelFileURLString:", "deviceType nil"),
             handlerError(kMove, "file (null) does not exist")};
       },
       false},
      {"no model file", [](test::TestDevice&, json&) {},
       [](const test::TestDevice& d) {
         return Lines{
             kStart, resourceLine(d, kModelPath),
             handlerError("getBatteryModelFileURLString:",
                          "file not present: " +
                              (d.dir() / "Library/KVR/BatteryModels" / kModelPath).string()),
             handlerError(kMove, "file (null) does not exist")};
       },
       false},
      {"a file the reader rejects",
       [](test::TestDevice& d, json&) {
         d.installModel(kModelPath, std::string("\x05\x90\x01", 3));
       },
       [](const test::TestDevice& d) {
         return Lines{
             kStart, resourceLine(d, kModelPath),
             handlerError("loadProtobufModelWithFileName:",
                          "readContent error is " +
                              (d.dir() / "Library/KVR/BatteryModels" / kModelPath).string() +
                              ": message 0 at offset 0 claims 5 bytes but only 2 remain "
                              "in the file"),
             handlerError(kMove, "protobufModel nil")};
       },
       false},
      {"an empty file", [](test::TestDevice& d, json&) { d.installModel(kModelPath, ""); },
       [](const test::TestDevice& d) {
         return Lines{kStart, resourceLine(d, kModelPath),
                      handlerError("loadProtobufModelWithFileName:", "protobufModelRCParams nil"),
                      handlerError(kMove, "protobufModel nil")};
       },
       false},
      {"a model too short for the record",
       [this](test::TestDevice& d, json&) {
         auto shortModel = model_->copy();
         shortModel->setGridOCVs(model_->gridOCVs(), 300);
         shortModel->setR2(nullptr);
         d.installModel(kModelPath, test::modelFile({shortModel}));
       },
       [](const test::TestDevice& d) {
         return Lines{kStart, resourceLine(d, kModelPath),
                      // One line, however many shortfalls.
                      handlerError("createKextModelFromProtobufModel:",
                                   "R2 nil: the record needs all 17 resistance tables; 1 more "
                                   "shortfall, rcmodel validate lists them"),
                      handlerError(kMove, "kextModel nil")};
       },
       false},
      {"no driver service",
       [&](test::TestDevice& d, json& j) {
         d.installModel(kModelPath, model);
         j["registry"].erase("TesvarKVR");
       },
       [](const test::TestDevice& d) {
         return Lines{kStart, resourceLine(d, kModelPath),
                      handlerError(kUpload, "no io service get matched"),
                      handlerError(kMove, "setBatteryModelDataToKernel failed")};
       },
       false},
      {"the connection refused",
       [&](test::TestDevice& d, json& j) {
         d.installModel(kModelPath, model);
         j["driver"]["openResult"] = -536870212;
       },
       [](const test::TestDevice& d) {
         return Lines{kStart, resourceLine(d, kModelPath),
                      handlerError(kUpload,
                                   "IOServiceOpen fail to connect, ioReturnResult = "
                                   "-536870212"),
                      handlerError(kMove, "setBatteryModelDataToKernel failed")};
       },
       false},
      {"the method refused",
       [&](test::TestDevice& d, json& j) {
         d.installModel(kModelPath, model);
         j["driver"]["setBatteryParamsResult"] = 5;
       },
       [](const test::TestDevice& d) {
         return Lines{kStart, resourceLine(d, kModelPath),
                      handlerError(kUpload,
                                   "IOConnectCallStructMethod fail to call IOUserClient "
                                   "setBatteryParams,  ioReturnResult = 5"),
                      handlerError(kMove, "setBatteryModelDataToKernel failed")};
       },
       false},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    json j = test::defaultDeviceJSON();
    test::TestDevice device(j);
    c.arrange(device, j);
    device.writeDeviceJSON(j);
    Lines lines = start(device, false);
    Lines expected = c.chain(device);
    expected.push_back(kFailed);
    EXPECT_EQ(lines, expected);
    EXPECT_EQ(fs::exists(device.dir() / "driver/battery_params.bin"), c.uploaded);
  }
}

TEST_F(Transfer, EveryHashProblemFailsTheVerification) {
  const std::string record = recordBytes(*model_);
  const SHA1Digest digest = sha1(record.data(), record.size());
  const std::string good(digest.begin(), digest.end());
  std::string lastDiffers = good;
  lastDiffers.back() ^= 1;
  const std::string firstByte = [&] {
    char buf[8];
    std::snprintf(buf, sizeof buf, "%x", static_cast<unsigned>(digest[0]));
    return std::string(buf);
  }();
  const std::string mismatchSame =
      handlerError(kVerify, "sentHash " + firstByte + " mismatches with returnedHash " + firstByte);

  struct Case {
    const char* name;
    json kvrVector;
    std::string verifyLine;
  };
  const Case cases[] = {
      {"no KVRVector", nullptr, handlerError(kVerify, "getKVRDebugDict failed")},
      {"KVRVector not a dictionary", json::array({1, 2}),
       handlerError(kVerify, "getKVRDebugDict failed")},
      {"no KVRBatteryModel", json::object(), handlerError(kVerify, "battModelDict nil")},
      {"KVRBatteryModel not a dictionary",
       {{"KVRBatteryModel", "hash"}},
       handlerError(kVerify, "battModelDict nil")},
      {"no RCParamsHash",
       {{"KVRBatteryModel", json::object()}},
       handlerError(kVerify, "RCParamsHash nil")},
      {"RCParamsHash not data",
       {{"KVRBatteryModel", {{"RCParamsHash", hex(good)}}}},
       handlerError(kVerify, "RCParamsHash nil")},
      {"short hash",
       {{"KVRBatteryModel", {{"RCParamsHash", {{"$data", hex(good.substr(0, 19))}}}}}},
       mismatchSame},
      {"long hash",
       {{"KVRBatteryModel", {{"RCParamsHash", {{"$data", hex(good + '\0')}}}}}},
       mismatchSame},
      {"last byte differs",
       {{"KVRBatteryModel", {{"RCParamsHash", {{"$data", hex(lastDiffers)}}}}}},
       mismatchSame},
      {"empty hash",
       {{"KVRBatteryModel", {{"RCParamsHash", {{"$data", ""}}}}}},
       handlerError(kVerify, "sentHash " + firstByte + " mismatches with returnedHash 0")},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    json j = test::defaultDeviceJSON();
    j["registry"]["TesvarKVR"]["KVRVector"] = c.kvrVector;
    test::TestDevice device(j);
    device.installModel(kModelPath, test::modelFile({model_}));
    Lines lines = start(device, false);
    EXPECT_EQ(lines, (Lines{kStart, resourceLine(device, kModelPath), c.verifyLine,
                            handlerError(kUpload, "hash verify failed"),
                            handlerError(kMove, "setBatteryModelDataToKernel failed"), kFailed}));
    // The driver accepted the record; a failed verification does not undo that.
    EXPECT_TRUE(fileContents(device.dir() / "driver/battery_params.bin") == record)
        << "the driver holds another record";
  }
}

TEST_F(Transfer, NullRecordNeverReachesTheDriver) {
  test::TestDevice device;
  EXPECT_FALSE(BatteryModelDataHandler::init()->setBatteryModelDataToKernel(nullptr));
  EXPECT_EQ(device.logLines(), Lines{handlerError(kUpload, "kextModel nil")});
  EXPECT_FALSE(fs::exists(device.dir() / "driver"));
}

}  // namespace
}  // namespace kolvrand
