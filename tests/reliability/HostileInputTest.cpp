// The real daemon meets broken and hostile inputs on a temporary copy of the
// example device. Whatever it meets, it logs why, leaves the neutral result
// (no upload, the boot session not marked done, earlier settings intact),
// keeps serving the aging activity and exits 0 on SIGTERM.
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <fstream>
#include <functional>
#include <nlohmann/json.hpp>

#include "model/OTAParamRC.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/KextBatteryModel.h"
#include "pipeline/PBStreamReader.h"
#include "platform/ValueJSON.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/ModelFiles.h"

namespace kolvrand {
namespace {

namespace fs = std::filesystem;
using nlohmann::json;
using Lines = std::vector<std::string>;

const char* const kModel = "Library/KVR/BatteryModels/T618e/2168.rcmodel";
const char* const kState = "state/com.tesvar.kolvrand.json";
const char* const kRecord = "driver/battery_params.bin";
const std::string kHandler = "error [batteryModelDataHandling] -[BatteryModelDataHandler ";
const std::string kLoad = kHandler + "loadProtobufModelWithFileName:] <Error> ";
const std::string kFailed = "error [main] Battery data upload failed";
const std::string kSucceeded = "default [main] Battery data upload succeeded";
const std::string kNoBootUUID = "error [main] Unable to get current boot UUID";

std::string readAll(const fs::path& path) {
  std::ifstream in(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(in), {}};
}

void writeAll(const fs::path& path, const std::string& bytes) {
  std::ofstream(path, std::ios::binary | std::ios::trunc) << bytes;
}

// A copy of examples/device whose settings already hold a value of the
// aging activity's and a boot session of earlier, for the test to check that
// a failure loses neither.
class Device {
 public:
  Device() {
    char pattern[] = "/tmp/kolvrand-hostile.XXXXXX";
    dir_ = mkdtemp(pattern);
    fs::copy(fs::path(KOLVRAND_SOURCE_DIR) / "examples/device", dir_, fs::copy_options::recursive);
    std::ifstream in(dir_ / "device.json");
    json_ = json::parse(in);
    fs::create_directories(dir_ / "state");
    writeAll(dir_ / kState, kEarlierState.dump(2));
  }
  ~Device() {
    std::error_code ec;
    fs::remove_all(dir_, ec);
  }
  const fs::path& dir() const { return dir_; }
  fs::path path(const char* relative) const { return dir_ / relative; }
  json& deviceJSON() { return json_; }
  void save() const { writeAll(dir_ / "device.json", json_.dump(2)); }
  std::string bootUUID() const { return json_["sysctl"]["kern.bootsessionuuid"]; }

  static inline const json kEarlierState = {
      {"savedBootUUID", "earlier-boot"}, {"savedChemID", 8552}, {"updateConditionMet", false}};

 private:
  fs::path dir_;
  json json_;
};

// Uploaded; failed after the driver took the record (verification); failed
// before; ended without a boot session.
enum class Outcome { Uploaded, Unverified, Failed, NoBootSession };

// Runs the daemon on `device` until the battery-model task has ended, then
// runs the aging activity once and stops it. Checks what every case must
// hold and returns the log lines.
Lines runDaemon(Device& device, Outcome outcome, std::vector<std::string> launcher = {}) {
  test::DaemonProcess daemon(device.dir(), "debug", std::move(launcher));
  EXPECT_TRUE(daemon.running());
  const std::string last = outcome == Outcome::Uploaded        ? kSucceeded
                           : outcome == Outcome::NoBootSession ? kNoBootUUID
                                                               : kFailed;
  const std::string lastText = last.substr(last.find("] ") + 2);
  EXPECT_TRUE(daemon.waitForLine({lastText}, std::chrono::seconds(60))) << daemon.rawStderr();
  EXPECT_TRUE(daemon.waitForLine({"checking in"})) << daemon.rawStderr();
  // Still serving: the activity runs on demand.
  daemon.signal(SIGUSR1);
  EXPECT_TRUE(daemon.waitForLine({"compensation has finished successfully"})) << daemon.rawStderr();
  daemon.signal(SIGTERM);
  EXPECT_EQ(daemon.waitForExit(), 0) << daemon.rawStderr();

  bool wellFormed = false;
  Lines lines = daemon.lines(&wellFormed);
  EXPECT_TRUE(wellFormed) << daemon.rawStderr();
  EXPECT_EQ(std::count(lines.begin(), lines.end(), last), 1) << daemon.rawStderr();

  // The settings parse and hold the earlier values, or the new boot session
  // after an upload; nothing else changed.
  json state = json::parse(readAll(device.path(kState)), nullptr, false);
  EXPECT_TRUE(state.is_object()) << readAll(device.path(kState));
  json expected = Device::kEarlierState;
  if (outcome == Outcome::Uploaded) expected["savedBootUUID"] = device.bootUUID();
  if (state.is_object() && outcome != Outcome::NoBootSession)
    state["savedChemID"] = expected["savedChemID"];  // read again at every start
  EXPECT_EQ(state, expected);
  EXPECT_EQ(fs::exists(device.path(kRecord)),
            outcome == Outcome::Uploaded || outcome == Outcome::Unverified);
  return lines;
}

bool contains(const Lines& lines, const std::string& text) {
  return std::any_of(lines.begin(), lines.end(),
                     [&](const std::string& l) { return l.find(text) != std::string::npos; });
}

std::string delimited(const std::string& message) {
  std::string out;
  uint64_t n = message.size();
  do {
    const auto b = static_cast<uint8_t>(n & 0x7f);
    n >>= 7;
    out += static_cast<char>(n ? b | 0x80 : b);
  } while (n);
  return out + message;
}

// Groups of an unknown field (1000) opened `depth` times and closed again,
// inside an otherwise empty model.
std::string nestedGroups(size_t depth) {
  std::string open = "\xc3\x3e", close = "\xc4\x3e";
  std::string body;
  for (size_t i = 0; i < depth; ++i) body += open;
  for (size_t i = 0; i < depth; ++i) body += close;
  return delimited(body);
}

struct ModelCase {
  const char* name;
  // Puts the hostile thing at the model's path.
  std::function<void(const fs::path&)> arrange;
  std::string line;  // a line of the failure chain, or part of one
};

TEST(HostileModelFile, IsRefusedWithAReasonAndNothingIsUploaded) {
  const std::string example = readAll(fs::path(KOLVRAND_SOURCE_DIR) / "examples/device" / kModel);
  const ModelCase cases[] = {
      {"a directory", [](const fs::path& p) { fs::create_directory(p); }, "not a regular file"},
      {"a FIFO", [](const fs::path& p) { mkfifo(p.c_str(), 0600); }, "not a regular file"},
      {"a symlink loop", [](const fs::path& p) { fs::create_symlink(p.filename(), p); },
       "getBatteryModelFileURLString:] <Error> file not present: "},
      {"a symlink to a dangling symlink",
       [](const fs::path& p) {
         fs::create_symlink("missing", p.parent_path() / "dangling");
         fs::create_symlink("dangling", p);
       },
       "getBatteryModelFileURLString:] <Error> file not present: "},
      {"empty", [](const fs::path& p) { writeAll(p, ""); }, kLoad + "protobufModelRCParams nil"},
      {"one byte over the cap",
       [](const fs::path& p) {
         std::ofstream big(p, std::ios::binary);
         big.seekp(PBStreamReader::kMaxFileSize);
         big.put('\0');
       },
       "4194305 bytes is larger than the 4194304-byte limit for a model file"},
      {"a length prefix of 2^63",
       [](const fs::path& p) {
         writeAll(p, std::string("\x80\x80\x80\x80\x80\x80\x80\x80\x80\x01", 10));
       },
       "message 0 at offset 0 claims 9223372036854775808 bytes but only 0 remain in the file"},
      {"cut short", [&](const fs::path& p) { writeAll(p, example.substr(0, example.size() / 2)); },
       "message 0 at offset 0 claims "},
      {"groups nested 100000 deep", [](const fs::path& p) { writeAll(p, nestedGroups(100000)); },
       "message 0 at offset 0 could not be decoded"},
      {"the example with its bytes reversed",
       [&](const fs::path& p) { writeAll(p, std::string(example.rbegin(), example.rend())); },
       kLoad + "readContent error is "},
  };
  for (const ModelCase& c : cases) {
    SCOPED_TRACE(c.name);
    Device device;
    fs::remove(device.path(kModel));
    c.arrange(device.path(kModel));
    Lines lines = runDaemon(device, Outcome::Failed);
    EXPECT_TRUE(contains(lines, c.line)) << testing::PrintToString(lines);
    // The reader refused before anything reached the record builder.
    EXPECT_FALSE(contains(lines, "createKextModelFromProtobufModel"))
        << testing::PrintToString(lines);
  }
}

TEST(HostileModelFile, GroupsNestedAsDeepAsAllowedStillRead) {
  Device device;
  writeAll(device.path(kModel), nestedGroups(64));
  Lines lines = runDaemon(device, Outcome::Failed);
  // Read, then refused only because an empty model cannot fill the record.
  EXPECT_TRUE(contains(lines, "createKextModelFromProtobufModel:] <Error> R0 nil"))
      << testing::PrintToString(lines);
}

// Four million empty messages in a file within the cap: only the first is
// kept, so the load costs time, not gigabytes (it took 6 GB when every
// message was kept).
TEST(HostileModelFile, MillionsOfEmptyMessagesCostNoMemory) {
  Device device;
  writeAll(device.path(kModel), std::string(PBStreamReader::kMaxFileSize, '\0'));
  test::DaemonProcess daemon(device.dir(), "default");
  ASSERT_TRUE(daemon.waitForLine({"Battery data upload failed"}, std::chrono::seconds(120)));
  long peakKiB = 0;
  {
    std::ifstream status("/proc/" + std::to_string(daemon.pid()) + "/status");
    for (std::string line; std::getline(status, line);)
      if (line.starts_with("VmHWM:")) peakKiB = std::stol(line.substr(6));
  }
  // Under AddressSanitizer freed memory waits in a quarantine of 256 MiB.
  EXPECT_GT(peakKiB, 0);
  EXPECT_LT(peakKiB, 1024 * 1024) << "peak resident set in KiB";
  daemon.signal(SIGTERM);
  EXPECT_EQ(daemon.waitForExit(), 0);
  // The daemon read it as the empty model it is.
  EXPECT_TRUE(contains(daemon.lines(), "createKextModelFromProtobufModel:] <Error> R0 nil"))
      << daemon.rawStderr();
}

// As root every file is readable, so the daemon runs as nobody, the way a
// service without privileges would meet a model file it may not read.
TEST(HostileModelFile, UnreadableIsRefused) {
  Device device;
  std::vector<std::string> launcher;
  if (geteuid() == 0) {
    if (access("/usr/bin/setpriv", X_OK) != 0) GTEST_SKIP() << "no setpriv to drop privileges";
    for (const auto& entry : fs::recursive_directory_iterator(device.dir()))
      ASSERT_EQ(lchown(entry.path().c_str(), 65534, 65534), 0);
    ASSERT_EQ(chown(device.dir().c_str(), 65534, 65534), 0);
    ASSERT_EQ(chown(device.path(kModel).c_str(), 0, 0), 0);
    launcher = {"/usr/bin/setpriv", "--reuid=65534", "--regid=65534", "--clear-groups"};
  }
  fs::permissions(device.path(kModel), fs::perms::none);
  Lines lines = runDaemon(device, Outcome::Failed, launcher);
  EXPECT_TRUE(contains(lines, kLoad + "readContent error is " + device.path(kModel).string() +
                                  ": cannot open: Permission denied"))
      << testing::PrintToString(lines);
}

// Appends `n` elements to both lists of a resistance table; other
// sub-messages have no lists.
template <typename Table>
void extendTable(Table* table, size_t n, float& v) {
  if constexpr (std::is_same_v<Table, OTAResistanceData>) {
    for (size_t i = 0; i < n; ++i) table->addResistance25C(v += 1);
    for (size_t i = 0; i < n; ++i) table->addTemperatureCoeff(v += 1);
  }
}

// Every list far longer than the record carries, the file just under the
// cap: read whole, and the record holds the lists' first elements as ever.
TEST(HostileModelFile, ListsFarLongerThanTheRecordJustUnderTheCap) {
  Device device;
  NSError error;
  auto messages = PBStreamReader::readProtoBuffersOfClass<OTAParamRC>(
      (fs::path(KOLVRAND_SOURCE_DIR) / "examples/device" / kModel).string(), &error);
  ASSERT_TRUE(messages && !messages->empty()) << error.localizedDescription;
  const auto original = messages->front();
  auto handler = std::make_shared<BatteryModelDataHandler>();
  handler->setLog(os_log_create("test", "batteryModelDataHandling"));
  const auto record = handler->createKextModelFromProtobufModel(original.get());
  ASSERT_TRUE(record);

  auto model = std::static_pointer_cast<OTAParamRC>(original->copy());
  const size_t cap = PBStreamReader::kMaxFileSize;
  float v = 1.0f;
  auto extend = [&](size_t n) {
#define KVR_EXTEND_SUB(number, name, Name, key, Class) extendTable(model->name().get(), n, v);
#define KVR_EXTEND_LIST(number, list, List, element, Element, key) \
  for (size_t i = 0; i < n; ++i) model->add##Element(v += 1);
#define KVR_EXTEND_NONE(...)
    KVR_OTA_PARAM_RC_FIELDS(KVR_EXTEND_SUB, KVR_EXTEND_LIST, KVR_EXTEND_NONE, KVR_EXTEND_NONE,
                            KVR_EXTEND_NONE)
#undef KVR_EXTEND_SUB
#undef KVR_EXTEND_LIST
#undef KVR_EXTEND_NONE
  };
  // Whole rounds over every list while one more fits, then single elements of
  // R0's first list (five bytes each) up to the cap.
  const size_t before = model->encodedSize();
  extend(1000);
  const double perRound = (model->encodedSize() - before) / 1000.0;
  extend(static_cast<size_t>((cap - model->encodedSize()) / perRound) - 2);
  while (model->encodedSize() + 16 < cap) model->r0()->addResistance25C(0.5f);
  const std::string file = test::modelFile({model});
  ASSERT_LE(file.size(), cap);
  ASSERT_GT(file.size(), cap - 32);
  writeAll(device.path(kModel), file);

  runDaemon(device, Outcome::Uploaded);
  const std::string sent = readAll(device.path(kRecord));
  ASSERT_EQ(sent.size(), sizeof(KextBatteryModel));
  EXPECT_EQ(std::memcmp(sent.data(), record.get(), sent.size()), 0);
}

// device.json is the simulated device's whole kernel and registry: when it is
// malformed, the daemon meets a device with no boot session and no services.
TEST(HostileDeviceFile, ServesNoBootSessionAndTouchesNothing) {
  std::string deep;
  for (int i = 0; i < 200000; ++i) deep += '[';
  deep += '1';
  for (int i = 0; i < 200000; ++i) deep += ']';
  const std::pair<const char*, std::string> cases[] = {
      {"empty", ""},
      {"not an object", "[1, 2, 3]"},
      {"truncated", R"({"sysctl": {"kern.bootsessionuuid": "1111)"},
      {"not UTF-8", "{\"sysctl\": {\"kern.bootsessionuuid\": \"\xff\xfe\"}}"},
      {"bad $data", R"({"sysctl": {"kern.bootsessionuuid": {"$data": "zz"}}})"},
      {"a property nested 200000 deep",
       R"({"sysctl": {"kern.bootsessionuuid": "1"}, "registry": {"TesvarSmartBattery": {"BatteryData": )" +
           deep + "}}}"},
      {"a 4 MiB string",
       R"({"sysctl": {"kern.bootsessionuuid": ")" + std::string(4 << 20, 'x') + "\", 1}}"},
  };
  for (const auto& [name, text] : cases) {
    SCOPED_TRACE(name);
    Device device;
    writeAll(device.dir() / "device.json", text);
    Lines lines = runDaemon(device, Outcome::NoBootSession);
    EXPECT_TRUE(contains(lines, "error [device] simulated device " + device.dir().string() + ": "))
        << testing::PrintToString(lines);
  }
  Device device;
  fs::remove(device.dir() / "device.json");
  fs::create_directory(device.dir() / "device.json");
  Lines lines = runDaemon(device, Outcome::NoBootSession);
  EXPECT_TRUE(contains(lines, "cannot read device.json: Is a directory"))
      << testing::PrintToString(lines);
}

TEST(ValueJSON, NestingIsBounded) {
  auto nested = [](int depth) {
    return platform::JSON::parse(std::string(depth, '[') + std::string(depth, ']'));
  };
  EXPECT_TRUE(platform::valueFromJSON(nested(64)));
  std::string error;
  EXPECT_FALSE(platform::valueFromJSON(nested(65), &error));
  EXPECT_EQ(
      error, "$" + [] {
        std::string s;
        for (int i = 0; i < 64; ++i) s += "[0]";
        return s;
      }() + ": nested more than 64 deep");
}

// Kernel variables and driver data of the wrong shape.
TEST(HostileDeviceData, IsRefusedWithAReason) {
  struct Case {
    const char* name;
    std::function<void(json&)> arrange;
    Outcome outcome;
    std::string line;
  };
  const Case cases[] = {
      {"a boot UUID that is not UTF-8",
       [](json& j) {
         j["sysctl"]["kern.bootsessionuuid"] = {{"$data", "11c3281100"}};
       },
       Outcome::NoBootSession, kNoBootUUID},
      {"a target type that is not UTF-8, needed for an unlisted chem ID",
       [](json& j) {
         j["sysctl"]["hw.targettype"] = {{"$data", "54ff00"}};
         j["registry"]["TesvarSmartBattery"]["BatteryData"]["AlgoChemID"] = 4660;
       },
       Outcome::Failed, kHandler + "getBatteryModelFileURLString:] <Error> deviceType nil"},
      {"a hash that is a string",
       [](json& j) {
         j["registry"]["TesvarKVR"]["KVRVector"] = {
             {"KVRBatteryModel", {{"RCParamsHash", std::string(40, '0')}}}};
       },
       Outcome::Unverified, kHandler + "verifyHashData:] <Error> RCParamsHash nil"},
      {"a hash of 4 KiB",
       [](json& j) {
         j["registry"]["TesvarKVR"]["KVRVector"] = {
             {"KVRBatteryModel", {{"RCParamsHash", {{"$data", std::string(8192, 'a')}}}}}};
       },
       Outcome::Unverified, "mismatches with returnedHash"},
      {"a chem ID that is a string",
       [](json& j) { j["registry"]["TesvarSmartBattery"]["BatteryData"]["AlgoChemID"] = "6439"; },
       Outcome::Failed, "Battery data upload run for chemId 0x0"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    Device device;
    c.arrange(device.deviceJSON());
    device.save();
    Lines lines = runDaemon(device, c.outcome);
    EXPECT_TRUE(contains(lines, c.line)) << testing::PrintToString(lines);
  }
}

// A serial number longer than the 17 bytes the daemon reads is no serial
// number: chem ID 5640 then takes its "a" model.
TEST(HostileDeviceData, OverlongSerialNumberSelectsTheDefaultModel) {
  Device device;
  auto& battery = device.deviceJSON()["registry"]["TesvarSmartBattery"]["BatteryData"];
  battery["AlgoChemID"] = 5640;
  battery["BatterySerialNumber"] = "0123456789ABCDE8" + std::string(4096, 'Z');
  device.save();
  fs::create_directories(device.dir() / "Library/KVR/BatteryModels/R72");
  fs::copy_file(fs::path(KOLVRAND_SOURCE_DIR) / "examples/models/R72/1608a.rcmodel",
                device.dir() / "Library/KVR/BatteryModels/R72/1608a.rcmodel");
  runDaemon(device, Outcome::Uploaded);
}

// A settings file that is truncated or holds no object reads as empty: the
// boot session counts as new, the upload runs and a whole file replaces it.
TEST(HostileStateFile, IsReadAsEmptyAndReplacedWhole) {
  const std::pair<const char*, std::string> cases[] = {
      {"truncated", Device::kEarlierState.dump(2).substr(0, 30)},
      {"an array", R"(["savedBootUUID", "6f1c2b7e-3d4a-4e5f-9a1b-2c3d4e5f6a7b"])"},
      {"a string", R"("savedBootUUID")"},
      {"empty", ""},
      {"binary", std::string("\x00\xff\x7b\x22", 4)},
  };
  for (const auto& [name, text] : cases) {
    SCOPED_TRACE(name);
    Device device;
    writeAll(device.path(kState), text);
    test::DaemonProcess daemon(device.dir(), "default");
    ASSERT_TRUE(daemon.waitForLine({"Battery data upload succeeded"})) << daemon.rawStderr();
    daemon.signal(SIGTERM);
    EXPECT_EQ(daemon.waitForExit(), 0);
    EXPECT_TRUE(contains(daemon.lines(), "error [defaults] " + device.path(kState).string() +
                                             " is not a JSON object; reading it as empty"))
        << daemon.rawStderr();
    EXPECT_EQ(json::parse(readAll(device.path(kState)), nullptr, false),
              (json{{"savedChemID", 8552}, {"savedBootUUID", device.bootUUID()}}));
  }
}

}  // namespace
}  // namespace kolvrand
