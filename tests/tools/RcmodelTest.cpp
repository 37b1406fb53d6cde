// SPDX-License-Identifier: MIT
// The rcmodel binary as scripts drive it: round trips through JSON, exit codes
// and what stderr says, where outputs go, validate and plot, and status and
// record against what the daemon does on a simulated device.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <regex>
#include <thread>

#include "base/CommonCrypto.h"
#include "daemon/BatteryModelTask.h"
#include "model/OTAParamRC.h"
#include "pipeline/DaemonIdentifier.h"
#include "tests/support/TestDevice.h"
#include "tests/tools/RunTool.h"
#include "tools/example_models/ExampleModel.h"

namespace kolvrand {
namespace {

namespace fs = std::filesystem;
using test::readFile;
using test::ToolRun;
using test::writeFile;

bool matches(const std::string& text, const std::string& pattern) {
  return std::regex_search(text, std::regex(pattern));
}

// The file of one example model, changed by `change`.
std::string exampleFile(void (*change)(OTAParamRC&) = nullptr) {
  auto model = makeExampleModel(0x2168);
  if (change) change(*model);
  return test::modelFile({model});
}

class Rcmodel : public ::testing::Test {
 protected:
  // "good" is a full model, "cut" the same cut short, "short" a model the
  // record builder refuses for three shortfalls, "empty" an empty file, "j"
  // wrong JSON.
  void SetUp() override {
    const std::string good = exampleFile();
    writeFile(s / "good", good);
    writeFile(s / "cut", good.substr(0, good.size() / 2));
    writeFile(s / "short", exampleFile([](OTAParamRC& m) {
                m.setR0(nullptr);
                m.r1()->setTemperatureCoeffs(m.r1()->temperatureCoeffs(), 152);
                m.clearSlopeForR3Extraps();
              }));
    writeFile(s / "empty", "");
    writeFile(s / "j", "{\"chemID\": 1, \"gridOCV\": [0.5, \"high\"]}");
    // A bare message whose last field (21, maxRdcRatio, a fixed32) breaks off.
    writeFile(s / "bare", std::string("\x90\x01\xe8\x42\xad\x01\x00\x00", 8));
  }
  test::Scratch s;
};

// What each use returns and prints, in rcmodel_uses.json: per use (strings
// between them are comments) the exit status, the arguments, what stderr must
// match (be empty for ""), what stdout must match (be empty when not given),
// and standard input; a use that fails writes nothing.
TEST_F(Rcmodel, ExitCodesAndMessages) {
  const auto uses =
      nlohmann::json::parse(readFile(KOLVRAND_SOURCE_DIR "/tests/tools/rcmodel_uses.json"));
  for (const auto& use : uses) {
    if (use.is_string()) continue;
    SCOPED_TRACE(use.dump());
    const auto text = [&](size_t i) { return use.size() > i ? use[i].get<std::string>() : ""; };
    const std::string err = text(2), out = text(3);
    ToolRun run = s.rcmodel(use[1].get<std::vector<std::string>>(), text(4));
    EXPECT_EQ(run.status, use[0].get<int>()) << run.err;
    EXPECT_TRUE(err.empty() ? run.err.empty() : matches(run.err, err)) << run.err;
    EXPECT_TRUE(matches(run.out, out.empty() ? "^$" : out)) << run.out;
    EXPECT_FALSE(fs::exists(s / "out"));
  }
}

// Every command that writes treats its output path alike: "-" and a link to
// /proc/self/fd/1 are standard output; a symlink, dangling or not, is written
// through and stays a link; the file it ends at is replaced by a new one with
// the old mode; a FIFO is written in place for its reader; a directory is
// refused; and a file that cannot be replaced keeps its old content while one
// line says why.
TEST_F(Rcmodel, OutputsAreWrittenWhereTheyPoint) {
  fs::permissions(s / ".", fs::perms(0755));
  writeFile(s / "m.json", "{\"chemID\": 8552}");
  fs::create_symlink("target", s / "link");
  // What /dev/stdout is; the real one is not named, since a fault that
  // replaced the link itself would replace it for the whole machine.
  fs::create_symlink("/proc/self/fd/1", s / "stdout");
  ASSERT_EQ(mkfifo((s / "fifo").c_str(), 0644), 0);
  // root may write anywhere, so the write that must fail runs as nobody.
  writeFile(s / "ro/out", "old");
  fs::permissions(s / "ro", fs::perms(0555));
  std::vector<std::string> asUser;
  if (geteuid() == 0)
    asUser = {"/usr/bin/setpriv", "--reuid=65534", "--regid=65534", "--clear-groups"};

  for (const char* command : {"encode", "record", "plot"}) {
    SCOPED_TRACE(command);
    auto run = [&](const std::string& out, const std::vector<std::string>& launcher = {}) {
      const std::string in = command == std::string("encode") ? "m.json" : "good";
      return s.rcmodel({command, in, "-o", out}, "", "", launcher);
    };
    ASSERT_EQ(run("plain").status, 0);
    const std::string expected = readFile(s / "plain");
    EXPECT_EQ(run("-").out, expected);
    // Written into the descriptor: the file the harness opened gets the
    // bytes, rather than a new file under its name.
    fs::remove(s / "seen");
    fs::create_hard_link(s / ".stdout", s / "seen");
    EXPECT_EQ(run("stdout").out, expected);
    EXPECT_EQ(readFile(s / "seen"), expected);

    fs::remove(s / "target");
    EXPECT_EQ(run("link").status, 0) << "dangling";
    // The file the link ends at is replaced by a new one (its old content
    // stays behind a hard link) with its old mode.
    writeFile(s / "target", "old");
    fs::permissions(s / "target", fs::perms(0640));
    fs::create_hard_link(s / "target", s / (std::string("hard.") + command));
    EXPECT_EQ(run("link").status, 0);
    EXPECT_TRUE(fs::is_symlink(s / "link"));
    EXPECT_EQ(readFile(s / "target"), expected);
    EXPECT_EQ(readFile(s / (std::string("hard.") + command)), "old");
    EXPECT_EQ(fs::status(s / "target").permissions(), fs::perms(0640));

    std::string heard;
    std::thread reader([&] { heard = readFile(s / "fifo"); });
    EXPECT_EQ(run("fifo").status, 0);
    reader.join();
    EXPECT_EQ(heard, expected);

    for (const auto& [out, why] :
         {std::pair{"ro", "is a directory; give a file to write"},
          {"ro/out",
           "cannot create a file in ro to replace it with: Permission denied; it was left as it "
           "was"}}) {
      ToolRun refused = run(out, asUser);
      EXPECT_EQ(refused.status, 1);
      EXPECT_TRUE(matches(refused.err, std::string("^rcmodel [a-z]+: ") + out + ": " + why + "\n$"))
          << refused.err;
    }
    EXPECT_EQ(readFile(s / "ro/out"), "old");
  }
  fs::permissions(s / "ro", fs::perms(0755));
}

// Every list in the record is reported, by the key its author writes, against
// the record's count; then each further file in turn.
TEST_F(Rcmodel, ValidateReportsEveryListAgainstTheRecord) {
  auto model = makeExampleModel(0x2168);
  std::vector<float> grid(model->gridOCVs(), model->gridOCVs() + model->gridOCVsCount());
  model->setGridOCVs(grid.data(), 300);
  std::vector<float> aging(110, 1e-4f);
  model->setAgingCoeffForR1s(aging.data(), aging.size());
  model->setRCFreq4(nullptr);
  model->setHasMLBConfig(false);
  ToolRun run = s.rcmodel({"validate", "-", "cut", "good"}, test::modelFile({model, model}));
  EXPECT_EQ(run.status, 1);
  EXPECT_TRUE(matches(run.err, "^rcmodel validate: cut: message 0")) << run.err;
  for (const char* text :
       {"^-\n  decodes: yes, 2 messages; the daemon uses the first",
        "gridOCV +300 +303  SHORT: 3 missing, the daemon refuses this",
        "agingCoeffForR1 +110 +102  8 beyond the record, dropped",
        "RCFreq4 +- +-  MISSING: the record needs all 17 resistance tables",
        "R0.resistance25C +51 +51  ok", "R0.temperatureCoeff +153 +153  ok",
        "note: MLBConfig not set; the record carries 0",
        "refused: the daemon would not load this model\n\ncut\n  decodes: no",
        "\n\ngood\n[\\s\\S]*\n  ok: the daemon would load it; record SHA-1 [0-9a-f]{40}\n$"})
    EXPECT_TRUE(matches(run.out, text)) << text << "\n" << run.out;
  // One row per resistance-table list and per model list.
  EXPECT_EQ(std::count(run.out.begin(), run.out.begin() + run.out.find("\n\ncut"), '\n'),
            1 + 1 + 1 + 16 * 2 + 1 + 22 + 1);
}

// A model the daemon refuses is drawn all the same, and the exit status says
// it is refused.
TEST_F(Rcmodel, PlotDrawsTheGridAndEveryTable) {
  const std::string model = exampleFile([](OTAParamRC& m) { m.setBaselineR4(nullptr); });
  ToolRun run = s.rcmodel({"plot", "-", "-o", "-"}, model);
  ASSERT_EQ(run.status, 1) << run.err;
  EXPECT_TRUE(matches(run.err, "^rcmodel plot: -: the daemon would refuse this model")) << run.err;
  const std::string& svg = run.out;
  EXPECT_TRUE(svg.starts_with("<?xml") && svg.ends_with("</svg>\n")) << svg.substr(0, 100);
  auto count = [&](const char* what) {
    const std::regex pattern(what);
    return std::distance(std::sregex_iterator(svg.begin(), svg.end(), pattern), {});
  };
  // Three OCV bands and their spread; for 16 tables, one resistance curve
  // and three bands of temperature coefficients.
  EXPECT_EQ(count("<polyline"), 3 + 3 + 16 * 4);
  EXPECT_EQ(count(">missing: the daemon refuses the model<"), 1);
  EXPECT_EQ(count("<text"), count("</text>"));
}

// status through a device's life, never writing; and record, whose digest is
// the one the daemon's upload leaves in the driver and whose -o writes the
// very bytes the driver received.
TEST_F(Rcmodel, StatusAndRecordAgreeWithTheDaemon) {
  test::TestDevice device;
  const fs::path model = device.dir() / "Library/KVR/BatteryModels/T618e/2168.rcmodel";
  device.installModel("T618e/2168.rcmodel", exampleFile());
  std::string report;
  auto field = [&](const std::string& key) {
    std::smatch m;
    std::regex_search(report, m, std::regex("(^|\n)" + key + ": +([^\n]*)"));
    return m[2].str();
  };
  auto verdict = [&] {
    ToolRun run = s.rcmodel({"status"}, "", device.dir().string());
    EXPECT_TRUE(run.status == 0 && run.err.empty()) << run.err;
    report = run.out;
    return field("verdict");
  };

  // Before the daemon ran: nothing saved, nothing published, and status
  // creates neither the state directory nor the driver's record.
  EXPECT_EQ(verdict(), "empty") << report;
  const std::string record = field("record SHA-1");
  EXPECT_EQ(field("power-management driver"), "found, holds no record");
  EXPECT_EQ(field("chem ID"), "0x2168 (8552), the battery reports 0x1927 (6439)");
  EXPECT_EQ(field("saved boot session"), "(none)");
  EXPECT_EQ(field("model file"), model.string());
  EXPECT_EQ(field("driver's hash"), "(none published)");
  EXPECT_EQ(field("next step"), "rcmodel upload");
  EXPECT_FALSE(fs::exists(device.dir() / "state") || fs::exists(device.dir() / "driver"));

  runBatteryModelTask(os_log_create(DaemonIdentifier, "main"),
                      BatteryModelDataHandler::init().get());
  const std::string uploaded = readFile(device.dir() / "driver/battery_params.bin");
  const SHA1Digest digest = sha1(uploaded.data(), uploaded.size());
  EXPECT_EQ(record, hexString(digest.data(), digest.size()));
  EXPECT_EQ(s.rcmodel({"record", model.string(), "-o", "record.bin"}).out, record + "\n");
  EXPECT_EQ(readFile(s / "record.bin"), uploaded);
  const std::string state = readFile(device.statePath());
  EXPECT_EQ(verdict(), "loaded") << report;
  EXPECT_EQ(field("driver's hash"), record);
  EXPECT_EQ(field("next step"), "");
  EXPECT_EQ(field("saved boot session"),
            "11111111-2222-3333-4444-555555555555 (this boot session)");

  // The driver reloaded since: it holds nothing, whatever the settings say.
  fs::rename(device.dir() / "driver", device.dir() / "driver.kept");
  EXPECT_EQ(verdict(), "empty") << report;
  EXPECT_EQ(field("next step"), "rcmodel upload");
  fs::rename(device.dir() / "driver.kept", device.dir() / "driver");

  // The model file changed after the upload.
  device.installModel("T618e/2168.rcmodel",
                      exampleFile([](OTAParamRC& m) { m.setMaxRdcRatio(9.0f); }));
  EXPECT_EQ(verdict(), "mismatch") << report;
  EXPECT_NE(field("record SHA-1"), field("driver's hash"));

  // A new boot session.
  auto json = test::defaultDeviceJSON();
  json["sysctl"]["kern.bootsessionuuid"] = "99999999-2222-3333-4444-555555555555";
  device.writeDeviceJSON(json);
  EXPECT_EQ(verdict(), "stale") << report;

  // No model file the daemon would read.
  fs::remove(model);
  fs::create_directory(model);
  EXPECT_EQ(verdict(), "missing") << report;
  EXPECT_EQ(field("model file exists"), "no, not a regular file");
  EXPECT_TRUE(matches(report, ": not a regular file \\(a directory\\)\n")) << report;
  fs::remove(model);

  // A model the record builder refuses, with the builder's reason.
  device.installModel("T618e/2168.rcmodel", exampleFile([](OTAParamRC& m) { m.clearGridOCVs(); }));
  EXPECT_EQ(verdict(), "missing") << report;
  EXPECT_EQ(field("record SHA-1"), "(refused by the record builder)");
  EXPECT_TRUE(matches(report,
                      "\nthe daemon's code logged:\n  -\\[BatteryModelDataHandler "
                      "createKextModelFromProtobufModel:\\] <Error> gridOCV holds 0 elements, the "
                      "record carries 303\n"))
      << report;
  EXPECT_EQ(readFile(device.statePath()), state);
}

// rcmodel upload: the daemon's own transfer, or the record of a given file,
// sent to the driver now and verified against the hash it publishes; the
// daemon's settings are left as they were. Each refusal is one line, and then
// nothing reaches the driver; status, which never writes, says what is
// missing. The uses are in rcmodel_uploads.json: the
// device is the example one with "device" merged into its device.json, its
// model installed unless "model" is false; "held" names the file whose record
// the driver then holds (MODEL: the installed one).
TEST_F(Rcmodel, UploadSendsTheRecordNowAndLeavesTheSettings) {
  const std::string settings = R"({"savedBootUUID": "earlier", "savedChemID": 1})";
  const auto uses =
      nlohmann::json::parse(readFile(KOLVRAND_SOURCE_DIR "/tests/tools/rcmodel_uploads.json"));
  for (const auto& use : uses) {
    SCOPED_TRACE(use.dump());
    auto json = test::defaultDeviceJSON();
    json.merge_patch(use.value("device", nlohmann::json::object()));
    test::TestDevice device(json);
    const fs::path model = device.dir() / "Library/KVR/BatteryModels/T618e/2168.rcmodel";
    // Another model than "good", so that what the driver holds tells them apart.
    if (use.value("model", true))
      writeFile(model, exampleFile([](OTAParamRC& m) { m.setChemID(1); }));
    writeFile(device.statePath(), settings);
    ToolRun run = s.rcmodel(use["args"], "", device.dir().string());
    EXPECT_EQ(run.status, use["status"].get<int>());
    const std::string err = use.value("err", "");
    EXPECT_TRUE(err.empty() ? run.err.empty() : matches(run.err, err)) << run.err;
    EXPECT_TRUE(matches(run.out, use["out"].get<std::string>())) << run.out;
    const fs::path sent = device.dir() / "driver/battery_params.bin";
    const std::string held = use.value("held", "");
    EXPECT_EQ(fs::exists(sent), !held.empty());
    if (!held.empty()) {
      s.rcmodel({"record", held == "MODEL" ? model.string() : held, "-o", "expected.bin"});
      EXPECT_EQ(readFile(sent), readFile(s / "expected.bin"));
    }
    EXPECT_EQ(readFile(device.statePath()), settings);
  }
}

}  // namespace
}  // namespace kolvrand
