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

std::string handlerError(const std::string& method, const std::string& text) {
  return "error [batteryModelDataHandling] -[BatteryModelDataHandler " + method + "] <Error> " +
         text;
}
const std::string kMove = "moveBatteryModelDataFromDiskToKext:";
const std::string kUpload = "setBatteryModelDataToKernel:";
const std::string kVerify = "verifyHashData:";
const std::string kURL = "getBatteryModelFileURLString:";
const std::string kStart = "debug [main] Battery data upload run for chemId 0x2168";
const std::string kFailed = "error [main] Battery data upload failed";
const std::string kSucceeded = "default [main] Battery data upload succeeded";
// "@" in an expected line stands for the model file's full path.
const std::string kResource = "debug [batteryModelDataHandling] -[BatteryModelDataHandler " + kURL +
                              "] workingDirURL resource: @ ";

std::string fileContents(const fs::path& path) {
  std::ifstream in(path, std::ios::binary);
  return std::string(std::istreambuf_iterator<char>(in), {});
}

// One start of the daemon's task per row, on the example device patched by the
// row (a null removes a key) after the previous session's mark was stored.
TEST(Transfer, EachOutcomeLeavesItsChainTheDriverAndTheMark) {
  const auto model = makeExampleModel(0x2168);
  const std::string good = test::modelFile({model});
  const auto built = BatteryModelDataHandler().createKextModelFromProtobufModel(model.get());
  const std::string record(reinterpret_cast<const char*>(built.get()), sizeof *built);
  const SHA1Digest digest = sha1(record.data(), record.size());
  const std::string hash(digest.begin(), digest.end());
  std::string lastDiffers = hash;
  lastDiffers.back() ^= 1;
  char first[4];
  std::snprintf(first, sizeof first, "%x", static_cast<unsigned>(digest[0]));
  auto shortModel = model->copy();
  shortModel->setGridOCVs(model->gridOCVs(), 300);
  shortModel->setR2(nullptr);
  auto kvr = [](json vector) {
    return json{{"registry", {{"TesvarKVR", {{"KVRVector", vector}}}}}};
  };
  auto kvrHash = [&](const std::string& b) {
    const std::string data = hexString(reinterpret_cast<const uint8_t*>(b.data()), b.size());
    return kvr({{"KVRBatteryModel", {{"RCParamsHash", {{"$data", data}}}}}});
  };
  const std::string notSent = handlerError(kMove, "setBatteryModelDataToKernel failed");
  auto hashFails = [&](const std::string& line) {
    return Lines{kStart,
                 kResource,
                 handlerError(kVerify, line),
                 handlerError(kUpload, "hash verify failed"),
                 notSent,
                 kFailed};
  };
  const std::string mismatch = std::string("sentHash ") + first + " mismatches with returnedHash ";
  struct Case {
    const char* name;
    json patch;
    std::optional<std::string> file;  // at T618e/2168.rcmodel
    Lines lines;
    bool uploaded;
  };
  const Case cases[] = {
      {"success", json::object(), good, {kStart, kResource, kSucceeded}, true},
      {"no device type",
       {{"registry", {{"TesvarSmartBattery", {{"BatteryData", {{"AlgoChemID", 1234}}}}}}},
        {"sysctl", {{"hw.targettype", nullptr}}}},
       good,
       {"debug [main] Battery data upload run for chemId 0x4d2",
        "error [batteryModelDataHandling] hw.targettype size could not be read. Returned err -1",
        handlerError(kURL, "deviceType nil"), handlerError(kMove, "file (null) does not exist"),
        kFailed},
       false},
      {"no model file",
       json::object(),
       std::nullopt,
       {kStart, kResource, handlerError(kURL, "file not present: @"),
        handlerError(kMove, "file (null) does not exist"), kFailed},
       false},
      {"a file the reader rejects",
       json::object(),
       std::string("\x05\x90\x01", 3),
       {kStart, kResource,
        handlerError("loadProtobufModelWithFileName:",
                     "readContent error is @: message 0 at offset 0 claims 5 bytes but only 2 "
                     "remain in the file"),
        handlerError(kMove, "protobufModel nil"), kFailed},
       false},
      {"an empty file",
       json::object(),
       "",
       {kStart, kResource,
        handlerError("loadProtobufModelWithFileName:", "protobufModelRCParams nil"),
        handlerError(kMove, "protobufModel nil"), kFailed},
       false},
      {"a model too short for the record",
       json::object(),
       test::modelFile({shortModel}),
       // One line, however many shortfalls.
       {kStart, kResource,
        handlerError("createKextModelFromProtobufModel:",
                     "R2 nil: the record needs all 17 resistance tables; 1 more shortfall, rcmodel "
                     "validate lists them"),
        handlerError(kMove, "kextModel nil"), kFailed},
       false},
      {"no driver service",
       {{"registry", {{"TesvarKVR", nullptr}}}},
       good,
       {kStart, kResource, handlerError(kUpload, "no io service get matched"), notSent, kFailed},
       false},
      {"the connection refused",
       {{"driver", {{"openResult", -536870212}}}},
       good,
       {kStart, kResource,
        handlerError(kUpload, "IOServiceOpen fail to connect, ioReturnResult = -536870212"),
        notSent, kFailed},
       false},
      {"the method refused",
       {{"driver", {{"setBatteryParamsResult", 5}}}},
       good,
       {kStart, kResource,
        handlerError(kUpload,
                     "IOConnectCallStructMethod fail to call IOUserClient setBatteryParams,  "
                     "ioReturnResult = 5"),
        notSent, kFailed},
       false},
      // A failed verification does not undo what the driver accepted.
      {"no KVRVector", kvr(nullptr), good, hashFails("getKVRDebugDict failed"), true},
      {"KVRVector not a dictionary", kvr({1, 2}), good, hashFails("getKVRDebugDict failed"), true},
      {"no KVRBatteryModel", kvr(json::object()), good, hashFails("battModelDict nil"), true},
      {"KVRBatteryModel not a dictionary", kvr({{"KVRBatteryModel", "hash"}}), good,
       hashFails("battModelDict nil"), true},
      {"no RCParamsHash", kvr({{"KVRBatteryModel", json::object()}}), good,
       hashFails("RCParamsHash nil"), true},
      {"RCParamsHash not data", kvr({{"KVRBatteryModel", {{"RCParamsHash", "00"}}}}), good,
       hashFails("RCParamsHash nil"), true},
      {"short hash", kvrHash(hash.substr(0, 19)), good, hashFails(mismatch + first), true},
      {"long hash", kvrHash(hash + '\0'), good, hashFails(mismatch + first), true},
      {"last byte differs", kvrHash(lastDiffers), good, hashFails(mismatch + first), true},
      {"empty hash", kvrHash(""), good, hashFails(mismatch + "0"), true},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    json j = test::defaultDeviceJSON();
    j.merge_patch(c.patch);
    // A KVRVector of null is kept: the driver's "none", where leaving it out
    // lets the simulated driver publish the hash of what it holds.
    const json::json_pointer vector("/registry/TesvarKVR/KVRVector");
    if (c.patch.contains(vector)) j[vector] = c.patch[vector];
    test::TestDevice device(j);
    const fs::path path = device.dir() / "Library/KVR/BatteryModels/T618e/2168.rcmodel";
    if (c.file) device.installModel("T618e/2168.rcmodel", *c.file);
    fs::create_directories(device.statePath().parent_path());
    std::ofstream(device.statePath()) << R"({"savedBootUUID": "previous-session"})";
    device.clearLog();
    runBatteryModelTask(os_log_create(DaemonIdentifier, "main"),
                        BatteryModelDataHandler::init().get());
    Lines expected = c.lines;
    for (std::string& line : expected)
      if (auto at = line.find('@'); at != std::string::npos) line.replace(at, 1, path.string());
    EXPECT_EQ(device.logLines(), expected);
    EXPECT_EQ(device.state()["savedBootUUID"], expected.back() == kSucceeded
                                                   ? "11111111-2222-3333-4444-555555555555"
                                                   : "previous-session");
    const fs::path driver = device.dir() / "driver/battery_params.bin";
    EXPECT_TRUE(fileContents(driver) == (c.uploaded ? record : ""))
        << "the driver holds another record";
  }
}

TEST(Transfer, NullRecordNeverReachesTheDriver) {
  test::TestDevice device;
  EXPECT_FALSE(BatteryModelDataHandler::init()->setBatteryModelDataToKernel(nullptr));
  EXPECT_EQ(device.logLines(), Lines{handlerError(kUpload, "kextModel nil")});
  EXPECT_FALSE(fs::exists(device.dir() / "driver"));
}

}  // namespace
}  // namespace kolvrand
