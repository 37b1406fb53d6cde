// Battery identity from the battery driver's registry data: the chem ID with
// its one replacement, and the serial-number suffix of chem ID 5640.
#include <gtest/gtest.h>

#include "pipeline/BatteryModelDataHandler.h"
#include "tests/support/TestDevice.h"

namespace kolvrand {
namespace {

using Lines = std::vector<std::string>;

const std::string kIntMethod =
    "error [batteryModelDataHandling] -[BatteryModelDataHandler "
    "getIntValueForKeyFromBatteryData:] <Error> ";
const std::string kSuffixMethod =
    "error [batteryModelDataHandling] -[BatteryModelDataHandler "
    "getSpecialCaseBatteryModelIdentifier:] <Error> ";

// The example device with other battery data: null takes the battery driver
// away, "absent" only its data.
nlohmann::json withBatteryData(const nlohmann::json& batteryData) {
  nlohmann::json json = test::defaultDeviceJSON();
  auto& battery = json["registry"]["TesvarSmartBattery"];
  battery["BatteryData"] = batteryData;
  if (batteryData == "absent") battery.erase("BatteryData");
  if (batteryData.is_null()) json["registry"].erase("TesvarSmartBattery");
  return json;
}

TEST(BatteryIdentity, ChemIDIsReadReplacedAndStored) {
  struct Case {
    nlohmann::json batteryData;
    uint32_t chemID;
    Lines lines;
  };
  const Case cases[] = {
      {{{"AlgoChemID", 6439}}, 8552, {}},
      {{{"AlgoChemID", 8552}}, 8552, {}},
      {{{"AlgoChemID", 6440}}, 6440, {}},
      {{{"AlgoChemID", 0}}, 0, {}},
      {{{"AlgoChemID", -1}}, 0xFFFFFFFF, {}},
      // A value wider than 32 bits keeps its low 32 bits, 6439, read as 8552.
      {{{"AlgoChemID", 0x100001927LL}}, 8552, {}},
      {{{"AlgoChemID", "6439"}}, 0, {kIntMethod + "valueCF null"}},
      {{{"BatterySerialNumber", "X"}}, 0, {kIntMethod + "valueCF null"}},
      {"absent", 0, {kIntMethod + "batteryData null"}},
      {{1, 2}, 0, {kIntMethod + "batteryData null"}},  // not a dictionary
      {nullptr, 0, {kIntMethod + "powerService null"}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.batteryData.dump());
    test::TestDevice device(withBatteryData(c.batteryData));
    auto handler = BatteryModelDataHandler::init();
    EXPECT_EQ(handler->getBatteryChemID(), c.chemID);
    EXPECT_EQ(device.logLines(), c.lines);
    EXPECT_EQ(device.state()["savedChemID"], c.chemID);
  }
  test::TestDevice device;
  EXPECT_EQ(BatteryModelDataHandler::init()->getIntValueForKeyFromBatteryData(nullptr), 0);
  EXPECT_EQ(device.logLines(), Lines{kIntMethod + "key null"});
}

TEST(BatteryIdentity, SerialNumberSuffixOfChemID5640) {
  struct Case {
    nlohmann::json batteryData;
    uint32_t chemID;
    std::string suffix;
    Lines lines;
  };
  const Case cases[] = {
      {{{"BatterySerialNumber", "0123456789ABCDE8"}}, 5640, "b", {}},
      {{{"BatterySerialNumber", "0123456789ABCDE8Z"}}, 5640, "b", {}},  // 17 bytes fit
      {{{"BatterySerialNumber", "0123456789ABCDE7"}}, 5640, "a", {}},
      {{{"BatterySerialNumber", "0123456789ABCD8"}}, 5640, "a", {}},  // 15 bytes
      {{{"BatterySerialNumber", ""}}, 5640, "a", {}},
      // 18 bytes do not fit with their NUL: read as no serial number at all.
      {{{"BatterySerialNumber", "0123456789ABCDE8ZZ"}}, 5640, "a", {}},
      // Sixteen bytes whose last is the second byte of a two-byte character.
      {{{"BatterySerialNumber", "0123456789ABCD\xc3\xa8"}}, 5640, "a", {}},
      {{{"AlgoChemID", 5640}}, 5640, "", {kSuffixMethod + "valueCF null"}},
      {{{"BatterySerialNumber", 8}}, 5640, "", {kSuffixMethod + "valueCF null"}},
      {"absent", 5640, "", {kSuffixMethod + "batteryData null"}},
      {nullptr, 5640, "", {kSuffixMethod + "powerService null"}},
      // Any other chem ID never looks at the registry.
      {nullptr, 5641, "", {}},
      {{{"BatterySerialNumber", "0123456789ABCDE8"}}, 8552, "", {}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.batteryData.dump() + " chem ID " + std::to_string(c.chemID));
    test::TestDevice device(withBatteryData(c.batteryData));
    EXPECT_EQ(BatteryModelDataHandler::init()->getSpecialCaseBatteryModelIdentifier(c.chemID),
              c.suffix);
    EXPECT_EQ(device.logLines(), c.lines);
  }
}

}  // namespace
}  // namespace kolvrand
