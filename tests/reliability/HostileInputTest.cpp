// The real daemon meets broken and hostile inputs on a temporary copy of the
// example device. Whatever it meets, it logs why, leaves the neutral result
// (no upload, the boot session not marked done, earlier settings intact),
// keeps serving the aging activity and exits 0 on SIGTERM.
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <functional>
#include <nlohmann/json.hpp>

#include "pipeline/PBStreamReader.h"
#include "tests/platform/TestUtil.h"
#include "tests/support/DaemonProcess.h"

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

using test::readFileText;
using test::writeFile;

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
    writeFile(dir_ / kState, kEarlierState.dump(2));
  }
  ~Device() {
    std::error_code ec;
    fs::remove_all(dir_, ec);
  }
  const fs::path& dir() const { return dir_; }
  fs::path path(const char* relative) const { return dir_ / relative; }
  json& deviceJSON() { return json_; }
  void save() const { writeFile(dir_ / "device.json", json_.dump(2)); }
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
Lines runDaemon(Device& device, Outcome outcome, std::vector<std::string> launcher = {},
                long* peakKiB = nullptr) {
  test::DaemonProcess daemon(device.dir(), "debug", std::move(launcher));
  EXPECT_TRUE(daemon.running());
  const std::string last = outcome == Outcome::Uploaded        ? kSucceeded
                           : outcome == Outcome::NoBootSession ? kNoBootUUID
                                                               : kFailed;
  const std::string lastText = last.substr(last.find("] ") + 2);
  EXPECT_TRUE(daemon.waitForLine({lastText}, std::chrono::seconds(120))) << daemon.rawStderr();
  EXPECT_TRUE(daemon.waitForLine({"checking in"})) << daemon.rawStderr();
  std::ifstream status("/proc/" + std::to_string(daemon.pid()) + "/status");
  for (std::string line; peakKiB && std::getline(status, line);)
    if (line.starts_with("VmHWM:")) *peakKiB = std::stol(line.substr(6));
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
  json state = json::parse(readFileText(device.path(kState)), nullptr, false);
  EXPECT_TRUE(state.is_object()) << readFileText(device.path(kState));
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

// A model of groups of an unknown field (1000) opened `depth` times and
// closed again, and nothing else.
std::string nestedGroups(size_t depth) {
  std::string body;
  for (size_t i = 0; i < depth; ++i) body += "\xc3\x3e";
  for (size_t i = 0; i < depth; ++i) body += "\xc4\x3e";
  std::string out;
  for (uint64_t n = body.size(); n; n >>= 7) out += static_cast<char>(n > 0x7f ? n | 0x80 : n);
  return out + body;
}

struct Case {
  const char* name;
  std::function<void(Device&)> arrange;
  Outcome outcome;
  std::string line;  // a line of the failure chain, or part of one
};

void runCases(const std::vector<Case>& cases) {
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    Device device;
    c.arrange(device);
    Lines lines = runDaemon(device, c.outcome);
    EXPECT_TRUE(contains(lines, c.line)) << testing::PrintToString(lines);
    // A refusal before the model was read whole reaches no record builder.
    if (c.outcome == Outcome::Failed && !c.line.starts_with("createKext")) {
      EXPECT_FALSE(contains(lines, "createKextModelFromProtobufModel"))
          << testing::PrintToString(lines);
    }
  }
}

TEST(HostileModelFile, IsRefusedWithAReasonAndNothingIsUploaded) {
  const std::string example =
      readFileText(fs::path(KOLVRAND_SOURCE_DIR) / "examples/device" / kModel);
  const auto put = [](std::function<void(const fs::path&)> make) {
    return [make](Device& d) {
      fs::remove(d.path(kModel));
      make(d.path(kModel));
    };
  };
  const auto bytes = [&](std::string b) {
    return put([b](const fs::path& p) { writeFile(p, b); });
  };
  const std::string notPresent = "getBatteryModelFileURLString:] <Error> file not present: ";
  runCases({
      {"a directory", put([](const fs::path& p) { fs::create_directory(p); }), Outcome::Failed,
       "not a regular file"},
      {"a FIFO", put([](const fs::path& p) { mkfifo(p.c_str(), 0600); }), Outcome::Failed,
       "not a regular file"},
      {"a symlink loop", put([](const fs::path& p) { fs::create_symlink(p.filename(), p); }),
       Outcome::Failed, notPresent},
      {"a symlink to a dangling symlink", put([](const fs::path& p) {
         fs::create_symlink("missing", p.parent_path() / "dangling");
         fs::create_symlink("dangling", p);
       }),
       Outcome::Failed, notPresent},
      {"empty", bytes(""), Outcome::Failed, kLoad + "protobufModelRCParams nil"},
      {"one byte over the cap", bytes(std::string(PBStreamReader::kMaxFileSize + 1, '\0')),
       Outcome::Failed, "4194305 bytes is larger than the 4194304-byte limit for a model file"},
      {"a length prefix of 2^63",
       bytes(std::string("\x80\x80\x80\x80\x80\x80\x80\x80\x80\x01", 10)), Outcome::Failed,
       "message 0 at offset 0 claims 9223372036854775808 bytes but only 0 remain in the file"},
      {"cut short", bytes(example.substr(0, example.size() / 2)), Outcome::Failed,
       "message 0 at offset 0 claims "},
      {"groups nested 100000 deep", bytes(nestedGroups(100000)), Outcome::Failed,
       "message 0 at offset 0 could not be decoded"},
      {"the example with its bytes reversed", bytes(std::string(example.rbegin(), example.rend())),
       Outcome::Failed, kLoad + "readContent error is "},
      // Read, then refused only because an empty model cannot fill the record.
      {"groups nested as deep as allowed", bytes(nestedGroups(64)), Outcome::Failed,
       "createKextModelFromProtobufModel:] <Error> R0 nil"},
  });
}

// The example model followed by four million empty messages, the file just
// at the cap: read whole, the first message is uploaded, and only it is kept,
// so the load costs time, not gigabytes (it took 6 GB when every message was).
TEST(HostileModelFile, MillionsOfEmptyMessagesCostNoMemory) {
  Device device;
  std::string file = readFileText(device.path(kModel));
  file.resize(PBStreamReader::kMaxFileSize, '\0');
  writeFile(device.path(kModel), file);
  long peakKiB = 0;
  runDaemon(device, Outcome::Uploaded, {}, &peakKiB);
  // Under AddressSanitizer freed memory waits in a quarantine of 256 MiB.
  EXPECT_GT(peakKiB, 0);
  EXPECT_LT(peakKiB, 1024 * 1024) << "peak resident set in KiB";
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

// Kernel variables and driver data of the wrong shape, and a device.json
// the device cannot load at all (each malformed kind is in the platform
// tests): the daemon meets a device with no boot session and no services.
TEST(HostileDeviceData, IsRefusedWithAReason) {
  const auto edit = [](std::function<void(json&)> change) {
    return [change](Device& d) {
      change(d.deviceJSON());
      d.save();
    };
  };
  runCases({
      {"device.json truncated",
       [](Device& d) { writeFile(d.dir() / "device.json", R"({"sysctl": {"kern.boot)"); },
       Outcome::NoBootSession, "error [device] simulated device "},
      {"a boot UUID that is not UTF-8", edit([](json& j) {
         j["sysctl"]["kern.bootsessionuuid"] = {{"$data", "11c3281100"}};
       }),
       Outcome::NoBootSession, kNoBootUUID},
      {"a target type that is not UTF-8, needed for an unlisted chem ID", edit([](json& j) {
         j["sysctl"]["hw.targettype"] = {{"$data", "54ff00"}};
         j["registry"]["TesvarSmartBattery"]["BatteryData"]["AlgoChemID"] = 4660;
       }),
       Outcome::Failed, kHandler + "getBatteryModelFileURLString:] <Error> deviceType nil"},
      {"a hash that is a string", edit([](json& j) {
         j["registry"]["TesvarKVR"]["KVRVector"] = {
             {"KVRBatteryModel", {{"RCParamsHash", std::string(40, '0')}}}};
       }),
       Outcome::Unverified, kHandler + "verifyHashData:] <Error> RCParamsHash nil"},
      {"a hash of 4 KiB", edit([](json& j) {
         j["registry"]["TesvarKVR"]["KVRVector"] = {
             {"KVRBatteryModel", {{"RCParamsHash", {{"$data", std::string(8192, 'a')}}}}}};
       }),
       Outcome::Unverified, "mismatches with returnedHash"},
      {"a chem ID that is a string", edit([](json& j) {
         j["registry"]["TesvarSmartBattery"]["BatteryData"]["AlgoChemID"] = "6439";
       }),
       Outcome::Failed, "Battery data upload run for chemId 0x0"},
      // More than the 17 bytes the daemon reads is no serial number: chem ID
      // 5640 then takes its "a" model.
      {"an overlong serial number",
       [](Device& d) {
         auto& battery = d.deviceJSON()["registry"]["TesvarSmartBattery"]["BatteryData"];
         battery["AlgoChemID"] = 5640;
         battery["BatterySerialNumber"] = "0123456789ABCDE8" + std::string(4096, 'Z');
         d.save();
         fs::create_directories(d.dir() / "Library/KVR/BatteryModels/R72");
         fs::copy_file(fs::path(KOLVRAND_SOURCE_DIR) / "examples/models/R72/1608a.rcmodel",
                       d.dir() / "Library/KVR/BatteryModels/R72/1608a.rcmodel");
       },
       Outcome::Uploaded, kSucceeded},
  });
}

// A settings file that is truncated or holds no object reads as empty: the
// boot session counts as new, the upload runs and a whole file replaces it.
TEST(HostileStateFile, IsReadAsEmptyAndReplacedWhole) {
  std::vector<Case> cases;
  for (const auto& [name, text] : std::initializer_list<std::pair<const char*, std::string>>{
           {"truncated", Device::kEarlierState.dump(2).substr(0, 30)},
           {"an array", R"(["savedBootUUID", "6f1c2b7e-3d4a-4e5f-9a1b-2c3d4e5f6a7b"])"},
           {"a string", R"("savedBootUUID")"},
           {"empty", ""},
           {"binary", std::string("\x00\xff\x7b\x22", 4)},
       })
    cases.push_back({name, [text](Device& d) { writeFile(d.path(kState), text); },
                     Outcome::Uploaded, " is not a JSON object; reading it as empty"});
  runCases(cases);
}

}  // namespace
}  // namespace kolvrand
