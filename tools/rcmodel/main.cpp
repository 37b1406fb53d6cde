// SPDX-License-Identifier: MIT
// rcmodel: for the people who write, ship and debug battery models. Decodes
// and encodes model files, builds the record the daemon would upload, checks
// a model against that record, draws it, and tells what the daemon on this
// device would load.
#include <cstdio>
#include <string>
#include <string_view>
#include <vector>

#include "tools/rcmodel/Tool.h"

namespace {

constexpr const char* kUsage = R"HELP(usage: rcmodel COMMAND [ARGS]

Commands:
  decode [--raw] FILE|-            print each message of a model file as JSON, one per line
  encode [--raw] JSON|- -o FILE    write a model file from JSON (the reverse of decode)
  record FILE [-o OUT]             build the daemon's record from the file's first message
                                   and print its SHA-1
  validate FILE...                 check that each file decodes and fills the record
  plot FILE -o OUT.svg             draw the OCV grid and the resistance tables
  status                           what the daemon on this device would load, whether the
                                   driver holds it, and what is wrong first (read-only)
  upload [FILE]                    upload the daemon's model (or FILE's) to the driver now
                                   and verify it

Run `rcmodel COMMAND --help` for the details of one command, `rcmodel --version`
for the version (that of the daemon whose code it runs).

Exit status: 0 on success; 1 when a model cannot be decoded, would be refused by
the daemon, or a file cannot be read or written; 2 for a wrong command line or
wrong JSON.

Environment: KOLVRAND_DEVICE=DIR makes status and upload use the simulated device
in DIR instead of this host.
)HELP";

constexpr const kolvrand::rcmodel::Command* kCommands[] = {
    &kolvrand::rcmodel::kDecode,   &kolvrand::rcmodel::kEncode, &kolvrand::rcmodel::kRecord,
    &kolvrand::rcmodel::kValidate, &kolvrand::rcmodel::kPlot,   &kolvrand::rcmodel::kStatus,
    &kolvrand::rcmodel::kUpload,
};

}  // namespace

int main(int argc, char** argv) {
  std::vector<std::string> args(argv + 1, argv + argc);
  if (args.empty()) {
    std::fputs(kUsage, stderr);
    return kolvrand::rcmodel::kExitUsage;
  }
  const std::string& name = args.front();
  if (name == "-h" || name == "--help" || name == "help") {
    std::fputs(kUsage, stdout);
    return kolvrand::rcmodel::kExitOK;
  }
  if (name == "--version" && args.size() == 1) {
    std::printf("rcmodel %s\n", KOLVRAND_VERSION);
    return kolvrand::rcmodel::kExitOK;
  }
  for (const kolvrand::rcmodel::Command* command : kCommands)
    if (name == command->name) return runCommand(*command, {args.begin() + 1, args.end()});
  std::fprintf(stderr, "rcmodel: unknown command \"%s\"; run rcmodel --help for the commands\n",
               name.c_str());
  return kolvrand::rcmodel::kExitUsage;
}
