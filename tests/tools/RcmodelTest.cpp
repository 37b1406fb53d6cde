// The rcmodel binary as scripts drive it: round trips through JSON, exit codes
// and what stderr says, where outputs go, validate and plot, and status and
// record against what the daemon does on a simulated device.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <regex>
#include <thread>

#include "daemon/BatteryModelTask.h"
#include "model/OTAParamRC.h"
#include "pipeline/DaemonIdentifier.h"
#include "platform/CommonCrypto.h"
#include "tests/support/ModelFiles.h"
#include "tests/support/TestDevice.h"
#include "tests/tools/RunTool.h"
#include "tools/example_models/ExampleModel.h"

namespace kolvrand {
namespace {

namespace fs = std::filesystem;
using test::readWhole;
using test::ToolRun;
using test::writeWhole;

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
  // record builder refuses, "empty" an empty file, "j" wrong JSON.
  void SetUp() override {
    const std::string good = exampleFile();
    writeWhole(s / "good", good);
    writeWhole(s / "cut", good.substr(0, good.size() / 2));
    writeWhole(s / "short", exampleFile([](OTAParamRC& m) { m.setR0(nullptr); }));
    writeWhole(s / "empty", "");
    writeWhole(s / "j", "{\"chemID\": 1, \"gridOCV\": [0.5, \"high\"]}");
    // A bare message whose last field (21, maxRdcRatio, a fixed32) breaks off.
    writeWhole(s / "bare", std::string("\x90\x01\xe8\x42\xad\x01\x00\x00", 8));
  }
  test::Scratch s;
};

// decode then encode gives the same file, of one message or several, and of
// one bare message as protoc reads and writes it.
TEST_F(Rcmodel, DecodeThenEncodeGivesTheSameFile) {
  const fs::path examples = fs::path(KOLVRAND_SOURCE_DIR) / "examples/models";
  const std::string one = readWhole(examples / "R72/1608a.rcmodel");
  for (const std::string& bytes : {one, one + readWhole(examples / "K517/1821.rcmodel") +
                                            readWhole(examples / "T604/1886.rcmodel")}) {
    writeWhole(s / "in", bytes);
    EXPECT_EQ(s.rcmodel({"encode", "-", "-o", "-"}, s.rcmodel({"decode", "in"}).out).out, bytes);
  }
  const std::vector<uint8_t> data = makeExampleModel(0x1608)->data();
  const std::string bare(data.begin(), data.end());
  const std::string json = s.rcmodel({"decode", "--raw", "-"}, bare).out;
  EXPECT_EQ(s.rcmodel({"encode", "--raw", "-", "-o", "-"}, json).out, bare);
}

// What each use returns and prints: stderr must match `err` (be empty for ""),
// stdout `out` (be empty for ""); a command that fails writes nothing.
TEST_F(Rcmodel, ExitCodesAndMessages) {
  struct Case {
    int status;
    std::vector<std::string> args;
    std::string err, out = "", input = "";
  } const cases[] = {
      {2, {}, "^usage: rcmodel COMMAND"},
      {0, {"--help"}, "", "^usage: rcmodel COMMAND[\\s\\S]*decode[\\s\\S]*status"},
      {0, {"status", "--help"}, "", "^usage: rcmodel status\n"},
      {2, {"frobnicate"}, "^rcmodel: unknown command \"frobnicate\"; run rcmodel --help"},
      {2, {"plot", "-x"}, "^rcmodel plot: unknown option -x; see rcmodel plot --help\n$"},
      // Each command's own check of its operands.
      {2, {"decode"}, "give one model file"},
      {2, {"encode", "-"}, "give the model file to write with -o FILE"},
      {2, {"record"}, "give one model file"},
      {2, {"validate"}, "give at least one model file"},
      {2, {"plot", "good"}, "give the picture to write with -o OUT.svg"},
      {2, {"status", "extra"}, "status takes no file"},
      {1, {"decode", "no"}, "no: cannot open: No such file.*; give the path of a model file\n$"},
      {1, {"decode", "cut"}, "^rcmodel decode: cut: message 0 at offset 0 claims .*use --raw\n$"},
      {1, {"decode", "empty"}, "^rcmodel decode: empty: holds no message"},
      // A bare message may be empty; of one that breaks off, what was read is
      // printed.
      {0, {"decode", "--raw", "empty"}, "", "^\\{.*\"chemID\":0"},
      {1, {"decode", "--raw", "bare"}, "breaks off at byte 6 of 8", "\"chemID\":8552"},
      // The JSON path of the wrong value, and how to write what was meant.
      {2, {"encode", "j", "-o", "out"}, "j: \\$.gridOCV\\[1\\]: expected a float.*\"-Infinity\""},
      {2, {"encode", "-", "-o", "out"}, "^rcmodel encode: stdin: \\$: holds no model", "", "[]"},
      {2, {"encode", "no", "-o", "out"}, "^rcmodel encode: no: cannot open"},
      {0, {"record", "good"}, "", "^[0-9a-f]{40}\n$"},
      // The daemon's own reasons, then what to do.
      {1, {"record", "short", "-o", "out"}, "R0 nil: .*\n.*short: the daemon would refuse"},
      {1, {"record", "empty"}, "protobufModelRCParams nil\n.*empty: the daemon cannot load this"},
      {1, {"plot", "cut", "-o", "out"}, "cut: message 0"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(testing::PrintToString(c.args));
    ToolRun run = s.rcmodel(c.args, c.input);
    EXPECT_EQ(run.status, c.status) << run.err;
    EXPECT_TRUE(c.err.empty() ? run.err.empty() : matches(run.err, c.err)) << run.err;
    EXPECT_TRUE(matches(run.out, c.out.empty() ? "^$" : c.out)) << run.out;
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
  writeWhole(s / "m.json", "{\"chemID\": 8552}");
  fs::create_symlink("target", s / "link");
  // What /dev/stdout is; the real one is not named, since a fault that
  // replaced the link itself would replace it for the whole machine.
  fs::create_symlink("/proc/self/fd/1", s / "stdout");
  ASSERT_EQ(mkfifo((s / "fifo").c_str(), 0644), 0);
  // root may write anywhere, so the write that must fail runs as nobody.
  fs::create_directory(s / "ro");
  writeWhole(s / "ro/out", "old");
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
    const std::string expected = readWhole(s / "plain");
    EXPECT_EQ(run("-").out, expected);
    // Written into the descriptor: the file the harness opened gets the
    // bytes, rather than a new file under its name.
    fs::remove(s / "seen");
    fs::create_hard_link(s / ".stdout", s / "seen");
    EXPECT_EQ(run("stdout").out, expected);
    EXPECT_EQ(readWhole(s / "seen"), expected);

    fs::remove(s / "target");
    EXPECT_EQ(run("link").status, 0) << "dangling";
    // The file the link ends at is replaced by a new one (its old content
    // stays behind a hard link) with its old mode.
    writeWhole(s / "target", "old");
    fs::permissions(s / "target", fs::perms(0640));
    fs::create_hard_link(s / "target", s / (std::string("hard.") + command));
    EXPECT_EQ(run("link").status, 0);
    EXPECT_TRUE(fs::is_symlink(s / "link"));
    EXPECT_EQ(readWhole(s / "target"), expected);
    EXPECT_EQ(readWhole(s / (std::string("hard.") + command)), "old");
    EXPECT_EQ(fs::status(s / "target").permissions(), fs::perms(0640));

    std::string heard;
    std::thread reader([&] { heard = readWhole(s / "fifo"); });
    EXPECT_EQ(run("fifo").status, 0);
    reader.join();
    EXPECT_EQ(heard, expected);

    for (const auto& [out, why] :
         {std::pair{"ro", "is a directory; give a file to write"},
          {"ro/out", "cannot write: Permission denied; it was left as it was"}}) {
      ToolRun refused = run(out, asUser);
      EXPECT_EQ(refused.status, 1);
      EXPECT_TRUE(matches(refused.err, std::string("^rcmodel [a-z]+: ") + out + ": " + why + "\n$"))
          << refused.err;
    }
    EXPECT_EQ(readWhole(s / "ro/out"), "old");
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

TEST_F(Rcmodel, PlotDrawsTheGridAndEveryTable) {
  const std::string model = exampleFile([](OTAParamRC& m) { m.setBaselineR4(nullptr); });
  ToolRun run = s.rcmodel({"plot", "-", "-o", "-"}, model);
  ASSERT_EQ(run.status, 0) << run.err;
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
  EXPECT_EQ(verdict(), "stale") << report;
  const std::string record = field("record SHA-1");
  EXPECT_EQ(field("saved boot session"), "(none)");
  EXPECT_EQ(field("model file"), model.string());
  EXPECT_EQ(field("driver's hash"), "(none published)");
  EXPECT_FALSE(fs::exists(device.dir() / "state") || fs::exists(device.dir() / "driver"));

  runBatteryModelTask(os_log_create(DaemonIdentifier, "main"),
                      BatteryModelDataHandler::init().get());
  const std::string uploaded = readWhole(device.dir() / "driver/battery_params.bin");
  const SHA1Digest digest = sha1(uploaded.data(), uploaded.size());
  EXPECT_EQ(record, hexString(digest.data(), digest.size()));
  EXPECT_EQ(s.rcmodel({"record", model.string(), "-o", "record.bin"}).out, record + "\n");
  EXPECT_EQ(readWhole(s / "record.bin"), uploaded);
  const std::string state = readWhole(device.statePath());
  EXPECT_EQ(verdict(), "loaded") << report;
  EXPECT_EQ(field("driver's hash"), record);
  EXPECT_EQ(field("saved boot session"),
            "11111111-2222-3333-4444-555555555555 (this boot session)");

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

  // No model file, or none the daemon would read.
  fs::remove(model);
  EXPECT_EQ(verdict(), "missing") << report;
  EXPECT_EQ(field("model file exists"), "no");
  fs::create_directory(model);
  EXPECT_EQ(verdict(), "missing") << report;
  EXPECT_EQ(field("model file exists"), "no, not a regular file");
  EXPECT_TRUE(matches(report, ": not a regular file\n")) << report;
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
  EXPECT_EQ(readWhole(device.statePath()), state);
}

}  // namespace
}  // namespace kolvrand
