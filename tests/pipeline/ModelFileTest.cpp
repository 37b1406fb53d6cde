// Finding and reading the model file: device type, path rules, and the stream
// reader's refusals.
#include <gtest/gtest.h>

#include <fstream>

#include "model/OTAParamRC.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/PBStreamReader.h"
#include "platform/Sysctl.h"
#include "tests/support/ModelFiles.h"
#include "tests/support/TestDevice.h"

namespace kolvrand {
namespace {

namespace fs = std::filesystem;
using Lines = std::vector<std::string>;
using nlohmann::json;

const std::string kHandler = "[batteryModelDataHandling] ";

// Chem IDs of the table never query the kernel; others fall back to the
// target type.
TEST(DeviceType, OtherChemIDsFallBackToTheTargetType) {
  const std::pair<uint32_t, const char*> rows[] = {
      {5426, "R71"},   {5458, "R70"},  {5638, "R70"},   {5639, "R72"},   {5640, "R72"},
      {5648, "R72"},   {5649, "R72"},  {5689, "R70"},   {6177, "K517"},  {6201, "T618e"},
      {6249, "K517"},  {6259, "K517"}, {6278, "T604"},  {6408, "T618e"}, {6436, "T618e"},
      {6439, "T618e"}, {6489, "T604"}, {8552, "T618e"},
  };
  struct Case {
    json targetType;  // null: absent
    std::optional<std::string> result;
    Lines lines;
  };
  const Case cases[] = {
      {"J42", "J42", {"debug " + kHandler + "Read HW type J42"}},
      {{{"$data", "4a343200"}}, "J42", {"debug " + kHandler + "Read HW type J42"}},
      // Raw bytes without a NUL still end at the value's size.
      {{{"$data", "4a3432"}}, "J42", {"debug " + kHandler + "Read HW type J42"}},
      {{{"$data", "4aff00"}}, std::nullopt, {"debug " + kHandler + "Read HW type J\xff"}},
      {nullptr,
       std::nullopt,
       {"error " + kHandler + "hw.targettype size could not be read. Returned err -1"}},
      // A size no target type has fails as a read does, never by throwing.
      {std::string(kMaxKernelStringSize + 1, 'J'),
       std::nullopt,
       {"error " + kHandler + "Failed to read hw.targettype. Returned err -1"}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.targetType.dump());
    json j = test::defaultDeviceJSON();
    j.merge_patch({{"sysctl", {{"hw.targettype", c.targetType}}}});
    test::TestDevice device(j);
    auto handler = BatteryModelDataHandler::init();
    for (uint32_t chemID : {0u, 5637u, 5650u, 5688u, 5690u, 6200u, 6440u}) {
      device.clearLog();
      EXPECT_EQ(handler->getDeviceType(chemID), c.result) << chemID;
      EXPECT_EQ(device.logLines(), c.lines) << chemID;
    }
    device.clearLog();
    for (auto [chemID, type] : rows) EXPECT_EQ(handler->getDeviceType(chemID), type) << chemID;
    EXPECT_EQ(device.logLines(), Lines{});
  }
}

TEST(DeviceType, KernelStringBufferOfAnySizeIsAllocatedOrRefused) {
  EXPECT_TRUE(allocateKernelStringBuffer(0));
  EXPECT_TRUE(allocateKernelStringBuffer(kMaxKernelStringSize));
  EXPECT_FALSE(allocateKernelStringBuffer(kMaxKernelStringSize + 1));
  EXPECT_FALSE(allocateKernelStringBuffer(SIZE_MAX));  // size + 1 would wrap
}

TEST(ModelFilePath, DeviceTypeChemIDAndSuffixNameTheFile) {
  struct Case {
    json batteryData;
    std::string relative;
  };
  const Case cases[] = {
      {{{"AlgoChemID", 6439}}, "T618e/2168.rcmodel"},
      {{{"AlgoChemID", 5640}, {"BatterySerialNumber", "0123456789ABCDE8"}}, "R72/1608b.rcmodel"},
      {{{"AlgoChemID", 5640}, {"BatterySerialNumber", "0123456789ABCDE1"}}, "R72/1608a.rcmodel"},
      {{{"AlgoChemID", 5640}}, "R72/1608.rcmodel"},
      {{{"AlgoChemID", 1234}}, "T618e/4d2.rcmodel"},  // from hw.targettype
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.relative);
    json j = test::defaultDeviceJSON();
    j["registry"]["TesvarSmartBattery"]["BatteryData"] = c.batteryData;
    test::TestDevice device(j);
    auto handler = BatteryModelDataHandler::init();
    uint32_t chemID = handler->getBatteryChemID();
    EXPECT_EQ(handler->getBatteryModelFileURLString(chemID), std::nullopt);
    device.installModel(c.relative, "");
    EXPECT_EQ(handler->getBatteryModelFileURLString(chemID),
              (device.dir() / "Library/KVR/BatteryModels" / c.relative).string());
  }
}

TEST(ModelFile, OnlyTheFirstMessageIsUsed) {
  test::TestDevice device;
  auto first = std::make_shared<OTAParamRC>();
  first->setChemID(1);
  auto second = std::make_shared<OTAParamRC>();
  second->setChemID(2);
  device.installModel("T618e/2168.rcmodel", test::modelFile({first, second}));
  auto handler = BatteryModelDataHandler::init();
  auto model = handler->loadProtobufModelWithFileName(
      (device.dir() / "Library/KVR/BatteryModels/T618e/2168.rcmodel").string());
  ASSERT_TRUE(model);
  EXPECT_EQ(model->chemID(), 1u);
  EXPECT_FALSE(handler->loadProtobufModelWithFileName(std::nullopt));
  EXPECT_EQ(
      device.logLines(),
      Lines{"error " + kHandler +
            "-[BatteryModelDataHandler loadProtobufModelWithFileName:] <Error> fileName nil"});
}

TEST(PBStreamReader, FramingErrorsSayWhere) {
  auto message = std::make_shared<OTAParamRC>();
  message->setChemID(0x2168);
  const std::string one = test::modelFile({message});
  struct Case {
    std::string bytes;
    std::optional<size_t> count;
    std::string error;
  };
  const Case cases[] = {
      {"", 0, ""},
      {one, 1, ""},
      {one + one + one, 3, ""},
      {std::string("\x00", 1), 1, ""},  // an empty message
      {"\x80", std::nullopt, "the length of message 0 at offset 0 is cut short"},
      {one + "\x81\x80", std::nullopt, "the length of message 1 at offset 5 is cut short"},
      {"\x05\x90\x01", std::nullopt,
       "message 0 at offset 0 claims 5 bytes but only 2 remain in "
       "the file"},
      {std::string("\xff\xff\xff\xff\xff\xff\xff\xff\xff\x7f", 10), std::nullopt,
       "the length of message 0 at offset 0 is not a valid varint"},
      {one + "\x02\x90\x80", std::nullopt, "message 1 at offset 5 could not be decoded"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(testing::PrintToString(c.bytes));
    NSError error;
    auto messages = PBStreamReader::readProtoBuffersOfClass<OTAParamRC>(
        std::span<const uint8_t>(reinterpret_cast<const uint8_t*>(c.bytes.data()), c.bytes.size()),
        &error);
    ASSERT_EQ(messages.has_value(), c.count.has_value());
    if (messages) {
      EXPECT_EQ(messages->size(), *c.count);
    }
    EXPECT_EQ(error.localizedDescription, c.error);
  }
}

}  // namespace
}  // namespace kolvrand
