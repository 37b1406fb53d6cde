// The rcmodel binary as scripts drive it: round trips through JSON, exit codes
// and messages, the record's digest against the daemon's upload, validate,
// plot, and status on simulated devices.
#include <gtest/gtest.h>

#include <sys/stat.h>
#include <algorithm>

#include <regex>
#include <span>
#include <thread>

#include "daemon/BatteryModelTask.h"
#include "model/OTAParamRC.h"
#include "pipeline/DaemonIdentifier.h"
#include "pipeline/KextBatteryModel.h"
#include "pipeline/PBStreamWriter.h"
#include "platform/CommonCrypto.h"
#include "tests/support/ModelFiles.h"
#include "tests/support/TestDevice.h"
#include "tests/tools/RunTool.h"
#include "tools/example_models/ExampleModel.h"

namespace kolvrand {
namespace {

namespace fs = std::filesystem;
using test::readWhole;
using test::Scratch;
using test::ToolRun;
using test::writeWhole;

std::string hex(const SHA1Digest& digest) {
  static const char* digits = "0123456789abcdef";
  std::string out;
  for (uint8_t b : digest) out += {digits[b >> 4], digits[b & 15]};
  return out;
}

std::string sha1Hex(const std::string& bytes) {
  return hex(sha1(bytes.data(), bytes.size()));
}

std::string exampleModelFile(uint32_t chemID = 0x2168) {
  return test::modelFile({makeExampleModel(chemID)});
}

TEST(Rcmodel, DecodeThenEncodeGivesTheSameFile) {
  Scratch scratch;
  auto file = [](const char* example) {
    return readWhole(fs::path(KOLVRAND_SOURCE_DIR) / "examples/models" / example);
  };
  const std::string one = file("R72/1608a.rcmodel");
  const std::string several = one + file("K517/1821.rcmodel") + file("T604/1886.rcmodel");
  for (const std::string& bytes : {one, several}) {
    writeWhole(scratch / "in.rcmodel", bytes);
    ToolRun decode = scratch.rcmodel({"decode", "in.rcmodel"});
    ASSERT_EQ(decode.status, 0) << decode.err;
    ToolRun encode = scratch.rcmodel({"encode", "-", "-o", "again.rcmodel"}, decode.out);
    ASSERT_EQ(encode.status, 0) << encode.err;
    EXPECT_EQ(readWhole(scratch / "again.rcmodel"), bytes);
  }
  // One bare message, as protoc reads and writes it, through stdin and stdout.
  ToolRun json = scratch.rcmodel({"decode", "in.rcmodel"});
  const std::string first = json.out.substr(0, json.out.find('\n') + 1);
  ToolRun bare = scratch.rcmodel({"encode", "--raw", "-", "-o", "-"}, first);
  ASSERT_EQ(bare.status, 0) << bare.err;
  EXPECT_EQ(scratch.rcmodel({"decode", "--raw", "-"}, bare.out).out, first);
  writeWhole(scratch / "none.rcmodel", "");
  ToolRun decode = scratch.rcmodel({"decode", "none.rcmodel"});
  EXPECT_EQ(decode.status, 1);
  EXPECT_EQ(scratch.rcmodel({"encode", "-", "-o", "none.again"}, decode.out).status, 2);
  EXPECT_FALSE(fs::exists(scratch / "none.again"));
}

// What each wrong use prints and returns. Files named here are made by the
// test: "good" is a full model, "cut" the same cut short, "short" a model the
// record builder refuses, "empty" an empty file.
TEST(Rcmodel, ExitCodesAndMessages) {
  Scratch scratch;
  const std::string good = exampleModelFile();
  writeWhole(scratch / "good.rcmodel", good);
  writeWhole(scratch / "cut.rcmodel", good.substr(0, good.size() / 2));
  auto shortModel = makeExampleModel(0x2168);
  shortModel->setR0(nullptr);
  writeWhole(scratch / "short.rcmodel", test::modelFile({shortModel}));
  writeWhole(scratch / "empty.rcmodel", "");
  writeWhole(scratch / "bad.json", "{\"chemID\": 1, \"gridOCV\": [0.5, \"high\"]}");
  // A bare message whose last field (21, maxRdcRatio, a fixed32) breaks off.
  writeWhole(scratch / "bare.bin", std::string("\x90\x01\xe8\x42\xad\x01\x00\x00", 8));

  struct Case {
    std::vector<std::string> args;
    std::string input;
    int status;
    std::string err;  // a regular expression stderr must match, "" for empty stderr
    std::string out;  // a regular expression stdout must match
  } const cases[] = {
      {{}, "", 2, "usage: rcmodel COMMAND", ""},
      {{"--help"}, "", 0, "", "usage: rcmodel COMMAND[\\s\\S]*decode[\\s\\S]*status"},
      {{"frobnicate"}, "", 2, "^rcmodel: unknown command \"frobnicate\"; run rcmodel --help", ""},
      {{"decode"},
       "",
       2,
       "^rcmodel decode: give one model file.*; see rcmodel decode --help\n$",
       ""},
      {{"decode", "--bogus", "good.rcmodel"}, "", 2, "unknown option --bogus", ""},
      {{"decode", "missing.rcmodel"},
       "",
       1,
       "missing.rcmodel: cannot open: No such file or directory; give the path of a model file\n$",
       "^$"},
      {{"decode", "cut.rcmodel"},
       "",
       1,
       "^rcmodel decode: cut.rcmodel: message 0 at offset 0 claims [0-9]+ bytes but only [0-9]+ "
       "remain in the file; if it holds one bare message without its length, use --raw\n$",
       "^$"},
      {{"decode", "empty.rcmodel"},
       "",
       1,
       "^rcmodel decode: empty.rcmodel: holds no message; a model file holds at least one",
       "^$"},
      // What was read before the break is printed.
      {{"decode", "--raw", "bare.bin"},
       "",
       1,
       "^rcmodel decode: bare.bin: the message breaks off at byte 6 of 8; what was read",
       "\"chemID\":8552"},
      {{"encode", "bad.json"}, "", 2, "give the model file to write with -o FILE", ""},
      {{"encode", "bad.json", "-o", "out.rcmodel"},
       "",
       2,
       "^rcmodel encode: bad.json: \\$.gridOCV\\[1\\]: expected a float, got the string \"high\" "
       "\\(NaN and the infinities are written \"NaN\", \"Infinity\", \"-Infinity\"\\); nothing was "
       "written\n$",
       "^$"},
      {{"encode", "--raw", "-", "-o", "out.rcmodel"},
       "[{}, {}]",
       2,
       "stdin: \\$: expected one object",
       "^$"},
      {{"encode", "nothere.json", "-o", "out.rcmodel"}, "", 2, "nothere.json: cannot open", ""},
      // Nothing may follow the JSON, not even behind a NUL byte.
      {{"encode", "-", "-o", "out.rcmodel"},
       std::string("{}\n\0{\"chemID\": 1}", 16),
       2,
       "stdin: \\$: not valid JSON: a NUL byte at line 2, column 1; nothing was written",
       "^$"},
      {{"encode", "-", "-o", "out.rcmodel"}, "{} x", 2, "at line 1, column 4: syntax error", "^$"},
      {{"encode", "-", "-o", "out.rcmodel"},
       "{}\n{}\n\n{\"chemID\": x}\n",
       2,
       "at line 4, column 12: syntax error",
       "^$"},
      {{"encode", "-", "-o", "out.rcmodel"},
       "{}\n{\"gridOCV\": [1, 1e39]}\n",
       2,
       "stdin: line 2: \\$.gridOCV\\[1\\]: 1e39 is out of range for a 32-bit float",
       "^$"},
      {{"encode", "-", "-o", "out.rcmodel"}, "[]", 2, "holds no model; a model file holds", "^$"},
      {{"encode", "--raw", "-", "-o", "out.rcmodel"}, "{}\n{}\n", 2, "expected one object", "^$"},
      {{"record"}, "", 2, "give one model file", ""},
      {{"record", "good.rcmodel"}, "", 0, "", "^[0-9a-f]{40}\n$"},
      {{"record", "short.rcmodel", "-o", "out.bin"},
       "",
       1,
       "^rcmodel record: -\\[BatteryModelDataHandler createKextModelFromProtobufModel:\\] <Error> "
       "R0 nil: the record needs all 17 resistance tables\nrcmodel record: short.rcmodel: the "
       "daemon would refuse this model \\(see above\\); rcmodel validate short.rcmodel lists",
       "^$"},
      {{"record", "empty.rcmodel"},
       "",
       1,
       "protobufModelRCParams nil\nrcmodel record: empty.rcmodel: the daemon cannot load this file",
       "^$"},
      {{"validate"}, "", 2, "give at least one model file", ""},
      {{"validate", "good.rcmodel", "short.rcmodel", "cut.rcmodel"},
       "",
       1,
       "cut.rcmodel: message 0",
       "good.rcmodel\n[\\s\\S]*ok: the daemon would load it[\\s\\S]*\n\nshort.rcmodel\n[\\s\\S]*R0 "
       "+- +- +MISSING"
       "[\\s\\S]*refused[\\s\\S]*\n\ncut.rcmodel\n  decodes: no"},
      {{"plot", "good.rcmodel"}, "", 2, "give the picture to write with -o OUT.svg", ""},
      {{"plot", "cut.rcmodel", "-o", "out.svg"}, "", 1, "cut.rcmodel: message 0", "^$"},
      {{"status", "extra"}, "", 2, "status takes no file", ""},
  };
  for (const Case& c : cases) {
    std::string command;
    for (const auto& a : c.args) command += a + " ";
    SCOPED_TRACE(command);
    ToolRun run = scratch.rcmodel(c.args, c.input);
    EXPECT_EQ(run.status, c.status) << run.err;
    if (c.err.empty())
      EXPECT_EQ(run.err, "");
    else
      EXPECT_TRUE(std::regex_search(run.err, std::regex(c.err))) << run.err;
    EXPECT_TRUE(std::regex_search(run.out, std::regex(c.out))) << run.out;
    // Nothing is written on failure.
    if (c.status != 0) {
      EXPECT_FALSE(fs::exists(scratch / "out.rcmodel"));
      EXPECT_FALSE(fs::exists(scratch / "out.bin"));
      EXPECT_FALSE(fs::exists(scratch / "out.svg"));
    }
  }
  for (const char* command : {"decode", "encode", "record", "validate", "plot", "status"}) {
    ToolRun help = scratch.rcmodel({command, "--help"});
    EXPECT_EQ(help.status, 0) << command;
    EXPECT_TRUE(help.out.starts_with(std::string("usage: rcmodel ") + command)) << help.out;
  }
}

// Every command that writes treats its output path alike: "-" is standard
// output, a symlink (dangling or not) is written through and stays a link, a
// FIFO is written in place for its reader, and a file that cannot be replaced
// keeps its old content while one line says why.
TEST(Rcmodel, OutputsAreWrittenWhereTheyPoint) {
  Scratch scratch;
  fs::permissions(scratch.dir(), fs::perms(0755));
  writeWhole(scratch / "m.rcmodel", exampleModelFile());
  writeWhole(scratch / "m.json", "{\"chemID\": 8552}");
  // The directory a user cannot write to; root is let through, so the
  // command is run as nobody then.
  fs::create_directory(scratch / "ro");
  writeWhole(scratch / "ro/out", "old");
  fs::permissions(scratch / "ro", fs::perms(0555));
  const std::vector<std::string> asUser =
      geteuid() == 0 ? std::vector<std::string>{"/usr/bin/setpriv", "--reuid=65534",
                                                "--regid=65534", "--clear-groups"}
                     : std::vector<std::string>{};

  struct Command {
    std::vector<std::string> args;  // followed by -o OUT
  } const commands[] = {{{"encode", "m.json"}}, {{"record", "m.rcmodel"}}, {{"plot", "m.rcmodel"}}};
  for (const Command& c : commands) {
    SCOPED_TRACE(c.args.front());
    auto run = [&](const std::string& out, std::vector<std::string> launcher = {}) {
      std::vector<std::string> args = c.args;
      args.insert(args.end(), {"-o", out});
      scratch.launcher = std::move(launcher);
      ToolRun r = scratch.rcmodel(args);
      scratch.launcher.clear();
      return r;
    };
    ASSERT_EQ(run("plain").status, 0);
    const std::string expected = readWhole(scratch / "plain");
    ASSERT_FALSE(expected.empty());

    fs::remove(scratch / "target"), fs::remove(scratch / "link");
    writeWhole(scratch / "target", "old");
    fs::create_symlink("target", scratch / "link");
    EXPECT_EQ(run("link").status, 0);
    EXPECT_TRUE(fs::is_symlink(scratch / "link"));
    EXPECT_EQ(readWhole(scratch / "target"), expected);

    fs::remove(scratch / "target");
    EXPECT_EQ(run("link").status, 0) << "dangling";
    EXPECT_TRUE(fs::is_symlink(scratch / "link"));
    EXPECT_EQ(readWhole(scratch / "target"), expected);

    fs::remove(scratch / "fifo");
    ASSERT_EQ(mkfifo((scratch / "fifo").c_str(), 0644), 0);
    std::string heard;
    std::thread reader([&] { heard = readWhole(scratch / "fifo"); });
    EXPECT_EQ(run("fifo").status, 0);
    reader.join();
    EXPECT_TRUE(fs::is_fifo(scratch / "fifo"));
    EXPECT_EQ(heard, expected);

    ToolRun toStdout = run("-");
    EXPECT_EQ(toStdout.status, 0);
    EXPECT_EQ(toStdout.out, expected);

    ToolRun denied = run("ro/out", asUser);
    EXPECT_EQ(denied.status, 1);
    EXPECT_EQ(std::count(denied.err.begin(), denied.err.end(), '\n'), 1) << denied.err;
    EXPECT_NE(denied.err.find("ro/out: cannot write: Permission denied"), std::string::npos)
        << denied.err;
    EXPECT_EQ(readWhole(scratch / "ro/out"), "old");
  }
  fs::permissions(scratch / "ro", fs::perms(0755));
}

// The digest `record` prints is the one the daemon's upload leaves in the
// driver, and -o writes the very bytes the driver received.
TEST(Rcmodel, RecordIsWhatTheDaemonUploads) {
  for (uint32_t chemID : {0x2168u, 0x1608u}) {
    test::TestDevice device;
    auto model = makeExampleModel(chemID);
    device.installModel("T618e/2168.rcmodel", test::modelFile({model}));
    runBatteryModelTask(os_log_create(DaemonIdentifier, "main"),
                        BatteryModelDataHandler::init().get());
    const std::string uploaded = readWhole(device.dir() / "driver/battery_params.bin");
    ASSERT_EQ(uploaded.size(), 29056u);

    const std::string file =
        (device.dir() / "Library/KVR/BatteryModels/T618e/2168.rcmodel").string();
    Scratch scratch;
    ToolRun run = scratch.rcmodel({"record", file, "-o", "record.bin"});
    ASSERT_EQ(run.status, 0) << run.err;
    EXPECT_EQ(run.out, sha1Hex(uploaded) + "\n");
    EXPECT_EQ(readWhole(scratch / "record.bin"), uploaded);
  }
}

// Every file list in the record is reported against the record's count.
TEST(Rcmodel, ValidateReportsEveryListAgainstTheRecord) {
  Scratch scratch;
  auto model = makeExampleModel(0x2168);
  std::vector<float> grid(model->gridOCVs(), model->gridOCVs() + model->gridOCVsCount());
  model->setGridOCVs(grid.data(), 300);
  std::vector<float> aging(110, 1e-4f);
  model->setAgingCoeffForR1s(aging.data(), aging.size());
  model->setRCFreq4(nullptr);
  model->setHasMLBConfig(false);
  writeWhole(scratch / "m.rcmodel", test::modelFile({model, model}));
  ToolRun run = scratch.rcmodel({"validate", "m.rcmodel"});
  EXPECT_EQ(run.status, 1);
  const std::string expected[] = {
      "decodes: yes, 2 messages; the daemon uses the first",
      "gridOCV +300 +303  SHORT: 3 missing, the daemon refuses this",
      "agingCoeffForR1 +110 +102  8 beyond the record, dropped",
      "RCFreq4 +- +-  MISSING: the record needs all 17 resistance tables",
      "R0.resistance25C +51 +51  ok",
      "R0.temperatureCoeff +153 +153  ok",
      "note: MLBConfig not set; the record carries 0",
      "refused: the daemon would not load this model",
  };
  for (const std::string& text : expected)
    EXPECT_TRUE(std::regex_search(run.out, std::regex(text))) << text << "\n" << run.out;
  // One row per resistance-table list and per model list.
  EXPECT_EQ(std::count(run.out.begin(), run.out.end(), '\n'), 1 + 1 + 1 + 16 * 2 + 1 + 22 + 1 + 1);
}

TEST(Rcmodel, PlotDrawsTheGridAndEveryTable) {
  Scratch scratch;
  auto model = makeExampleModel(0x2168);
  model->setBaselineR4(nullptr);
  writeWhole(scratch / "m.rcmodel", test::modelFile({model}));
  ToolRun run = scratch.rcmodel({"plot", "m.rcmodel", "-o", "m.svg"});
  ASSERT_EQ(run.status, 0) << run.err;
  const std::string svg = readWhole(scratch / "m.svg");
  EXPECT_TRUE(svg.starts_with("<?xml")) << svg.substr(0, 100);
  EXPECT_TRUE(svg.ends_with("</svg>\n"));
  auto count = [&](const std::string& what) {
    size_t n = 0;
    for (size_t at = svg.find(what); at != std::string::npos; at = svg.find(what, at + 1)) ++n;
    return n;
  };
  // Three OCV bands and their spread; for 16 tables, one resistance curve
  // and three bands of temperature coefficients.
  EXPECT_EQ(count("<polyline"), 3u + 3u + 16u * 4u);
  EXPECT_EQ(count(">each band minus band 1<"), 1u);
  EXPECT_EQ(count("temperature band "), 3u);
  EXPECT_EQ(count(">missing: the daemon refuses the model<"), 1u);
  EXPECT_EQ(count("<text"), count("</text>"));
}

// The verdict through a device's life, and that status never writes.
TEST(Rcmodel, StatusFollowsTheDaemon) {
  test::TestDevice device;
  const std::string modelPath = "T618e/2168.rcmodel";
  device.installModel(modelPath, exampleModelFile());
  Scratch scratch;
  auto status = [&] {
    ToolRun run = scratch.rcmodel({"status"}, "", device.dir().string());
    EXPECT_EQ(run.status, 0) << run.err;
    EXPECT_EQ(run.err, "");
    return run.out;
  };
  auto field = [](const std::string& report, const std::string& key) {
    std::smatch m;
    std::regex_search(report, m, std::regex("(^|\n)" + key + ": +([^\n]*)"));
    return m.size() > 2 ? m[2].str() : "(no " + key + ")";
  };
  const std::string recordHash = sha1Hex([&] {
    // A handler without defaults, which leaves the state directory alone.
    auto record =
        BatteryModelDataHandler().createKextModelFromProtobufModel(makeExampleModel(0x2168).get());
    return std::string(reinterpret_cast<const char*>(record.get()), 29056);
  }());

  // Before the daemon ran: nothing saved, nothing published, and status
  // creates neither the state directory nor the driver's record.
  std::string report = status();
  EXPECT_EQ(field(report, "verdict"), "stale") << report;
  EXPECT_EQ(field(report, "saved boot session"), "(none)");
  EXPECT_EQ(field(report, "chem ID"), "0x2168 (8552)");
  EXPECT_EQ(field(report, "device type"), "T618e");
  EXPECT_EQ(field(report, "model file"),
            (device.dir() / "Library/KVR/BatteryModels" / modelPath).string());
  EXPECT_EQ(field(report, "record SHA-1"), recordHash);
  EXPECT_EQ(field(report, "driver's hash"), "(none published)");
  EXPECT_FALSE(fs::exists(device.dir() / "state"));
  EXPECT_FALSE(fs::exists(device.dir() / "driver"));

  runBatteryModelTask(os_log_create(DaemonIdentifier, "main"),
                      BatteryModelDataHandler::init().get());
  const auto stateBefore = readWhole(device.statePath());
  report = status();
  EXPECT_EQ(field(report, "verdict"), "loaded") << report;
  EXPECT_EQ(field(report, "driver's hash"), recordHash);
  EXPECT_EQ(field(report, "saved boot session"),
            "11111111-2222-3333-4444-555555555555 (this boot session)");

  // The model file changed after the upload.
  auto other = makeExampleModel(0x2168);
  other->setMaxRdcRatio(9.0f);
  device.installModel(modelPath, test::modelFile({other}));
  report = status();
  EXPECT_EQ(field(report, "verdict"), "mismatch") << report;
  EXPECT_NE(field(report, "record SHA-1"), field(report, "driver's hash"));

  // A new boot session.
  auto json = test::defaultDeviceJSON();
  json["sysctl"]["kern.bootsessionuuid"] = "99999999-2222-3333-4444-555555555555";
  device.writeDeviceJSON(json);
  EXPECT_EQ(field(status(), "verdict"), "stale");

  // No model file at all.
  fs::remove(device.dir() / "Library/KVR/BatteryModels" / modelPath);
  report = status();
  EXPECT_EQ(field(report, "verdict"), "missing") << report;
  EXPECT_EQ(field(report, "model file exists"), "no");

  // What the daemon would refuse to read, status does not call a model file.
  fs::create_directory(device.dir() / "Library/KVR/BatteryModels" / modelPath);
  report = status();
  EXPECT_EQ(field(report, "model file exists"), "no, not a regular file");
  EXPECT_EQ(field(report, "verdict"), "missing") << report;
  EXPECT_NE(report.find(": not a regular file\n"), std::string::npos) << report;
  fs::remove(device.dir() / "Library/KVR/BatteryModels" / modelPath);

  // A model the record builder refuses.
  auto incomplete = makeExampleModel(0x2168);
  incomplete->clearGridOCVs();
  device.installModel(modelPath, test::modelFile({incomplete}));
  report = status();
  EXPECT_EQ(field(report, "verdict"), "missing") << report;
  EXPECT_EQ(field(report, "record SHA-1"), "(refused by the record builder)");
  // With the builder's reason.
  EXPECT_NE(report.find("\nthe daemon's code logged:\n  -[BatteryModelDataHandler "
                        "createKextModelFromProtobufModel:] <Error> gridOCV holds 0 elements, "
                        "the record carries 303\n"),
            std::string::npos)
      << report;

  EXPECT_EQ(readWhole(device.statePath()), stateBefore);
}

}  // namespace
}  // namespace kolvrand
