// SPDX-License-Identifier: MIT
// Which model file the battery gets and how it is read: the battery's identity
// from the battery driver's registry data, the device type, the path rules and
// the stream reader's refusals.
#include <gtest/gtest.h>

#include "model/OTAParamRC.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/PBStreamReader.h"
#include "platform/Sysctl.h"
#include "tests/support/Files.h"
#include "tests/support/TestDevice.h"

namespace kolvrand {
namespace {

using Lines = std::vector<std::string>;
using nlohmann::json;

const std::string kHandler = "[batteryModelDataHandling] ";

// The chem ID with its one replacement, stored as read; and the serial-number
// suffix of the model file's name, which only chem ID 5640 has. The cases are
// in identity_cases.json.
TEST(BatteryIdentity, ChemIDAndSerialNumberSuffix) {
  for (const json& c :
       json::parse(test::readFile(KOLVRAND_SOURCE_DIR "/tests/pipeline/identity_cases.json"))) {
    if (c.is_string()) continue;
    const json& batteryData = c[0];
    const uint32_t chemID = c[1];
    SCOPED_TRACE(batteryData.dump());
    json device = test::defaultDeviceJSON();
    auto& battery = device["registry"]["TesvarSmartBattery"];
    battery["BatteryData"] = batteryData;
    if (batteryData == "absent") battery.erase("BatteryData");
    if (batteryData.is_null()) device["registry"].erase("TesvarSmartBattery");
    test::TestDevice testDevice(device);
    auto handler = BatteryModelDataHandler::init();
    EXPECT_EQ(handler->getBatteryChemID(), chemID);
    EXPECT_EQ(handler->getBatteryModelFilePath(5640),
              (testDevice.dir() / "Library/KVR/BatteryModels/R72/1608").string() +
                  c[2].get<std::string>() + ".rcmodel");
    // Any other chem ID never looks at the registry.
    EXPECT_EQ(handler->getSpecialCaseBatteryModelIdentifier(5641), "");
    EXPECT_EQ(testDevice.logLines(), c[3].get<Lines>());
    EXPECT_EQ(testDevice.state()["savedChemID"], chemID);
  }
}

// Chem IDs of the table never query the kernel; others fall back to the
// target type, and a target type that cannot be read is none. The model file
// lies in a directory of the device type's name; one that is no directory
// name names no file, whatever lies where it points.
TEST(DeviceType, OtherChemIDsFallBackToTheTargetType) {
  const std::pair<uint32_t, const char*> rows[] = {
      {5426, "R71"},   {5458, "R70"},  {5638, "R70"},   {5639, "R72"},   {5640, "R72"},
      {5648, "R72"},   {5649, "R72"},  {5689, "R70"},   {6177, "K517"},  {6201, "T618e"},
      {6249, "K517"},  {6259, "K517"}, {6278, "T604"},  {6408, "T618e"}, {6436, "T618e"},
      {6439, "T618e"}, {6489, "T604"}, {8552, "T618e"},
  };
  const std::tuple<json, std::optional<std::string>, std::string, bool> cases[] = {
      // target type, device type, line, whether it names a file
      {"J42", "J42", "debug " + kHandler + "Read HW type J42", true},
      {{{"$data", "4a343200"}}, "J42", "debug " + kHandler + "Read HW type J42", true},
      // Raw bytes without a NUL still end at the value's size.
      {{{"$data", "4a3432"}}, "J42", "debug " + kHandler + "Read HW type J42", true},
      {"..", "..", "debug " + kHandler + "Read HW type ..", false},
      {".", ".", "debug " + kHandler + "Read HW type .", false},
      {"a/b", "a/b", "debug " + kHandler + "Read HW type a/b", false},
      {{{"$data", "4aff00"}}, std::nullopt, "debug " + kHandler + "Read HW type J\xff", false},
      {nullptr, std::nullopt,
       "error " + kHandler + "hw.targettype size could not be read. Returned err -1", false},
      // A size no target type has fails as a read does, never by throwing.
      {std::string(kMaxKernelStringSize + 1, 'J'), std::nullopt,
       "error " + kHandler + "Failed to read hw.targettype. Returned err -1", false},
  };
  for (const auto& [targetType, result, line, namesFile] : cases) {
    SCOPED_TRACE(targetType.dump());
    json j = test::defaultDeviceJSON();
    j.merge_patch({{"sysctl", {{"hw.targettype", targetType}}}});
    test::TestDevice device(j);
    auto handler = BatteryModelDataHandler::init();
    for (uint32_t chemID : {0u, 5637u, 5650u, 5688u, 5690u, 6200u, 6440u}) {
      device.clearLog();
      EXPECT_EQ(handler->getDeviceType(chemID), result) << chemID;
      EXPECT_EQ(device.logLines(), Lines{line}) << chemID;
    }
    device.clearLog();
    for (auto [chemID, type] : rows) EXPECT_EQ(handler->getDeviceType(chemID), type) << chemID;
    EXPECT_EQ(device.logLines(), Lines{});
    // A model where the path leads is found only if the device type names it.
    EXPECT_EQ(handler->getBatteryModelFileURLString(0x1234), std::nullopt);
    if (!result) continue;
    const std::string path =
        (device.dir() / "Library/KVR/BatteryModels/").string() + *result + "/1234.rcmodel";
    device.installModel(*result + "/1234.rcmodel", "");
    EXPECT_EQ(handler->getBatteryModelFileURLString(0x1234),
              namesFile ? std::optional(path) : std::nullopt);
  }
  EXPECT_TRUE(allocateKernelStringBuffer(0));
  EXPECT_TRUE(allocateKernelStringBuffer(kMaxKernelStringSize));
  EXPECT_FALSE(allocateKernelStringBuffer(SIZE_MAX));  // size + 1 would wrap
}

TEST(PBStreamReader, FramingErrorsSayWhere) {
  auto message = std::make_shared<OTAParamRC>();
  message->setChemID(0x2168);
  const std::string one = test::modelFile({message});
  const std::tuple<std::string, std::optional<size_t>, std::string> cases[] = {
      {"", 0, ""},
      {one, 1, ""},
      {one + one + one, 3, ""},
      {std::string("\x00", 1), 1, ""},  // an empty message
      {"\x80", std::nullopt, "the length of message 0 at offset 0 is cut short"},
      {one + "\x81\x80", std::nullopt, "the length of message 1 at offset 5 is cut short"},
      {"\x05\x90\x01", std::nullopt,
       "message 0 at offset 0 claims 5 bytes but only 2 remain in the file"},
      {std::string(10, '\xff'), std::nullopt,
       "the length of message 0 at offset 0 is not a valid varint"},
      {one + "\x02\x90\x80", std::nullopt, "message 1 at offset 5 could not be decoded"},
  };
  for (const auto& [bytes, count, why] : cases) {
    SCOPED_TRACE(testing::PrintToString(bytes));
    NSError error;
    auto messages = PBStreamReader::readProtoBuffersOfClass<OTAParamRC>(
        std::span(reinterpret_cast<const uint8_t*>(bytes.data()), bytes.size()), &error);
    EXPECT_EQ(messages ? std::optional(messages->size()) : std::nullopt, count);
    EXPECT_EQ(error.localizedDescription, why);
  }
}

}  // namespace
}  // namespace kolvrand
