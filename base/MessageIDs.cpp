// SPDX-License-Identifier: MIT
// The lines are known by their fixed part, so the call sites and their
// formats stay as they are. Each ID must have its entry in
// packaging/catalog/kolvrand.catalog (a test holds the two together).
#include "base/MessageIDs.h"

namespace kolvrand {

namespace {

enum class Match { Whole, Start, End };

struct Row {
  Match match;
  std::string_view text;
  std::string_view id;
};

constexpr Row kRows[] = {
    {Match::Whole, "Battery data upload succeeded", "1afedce1f3ed472788962886e56098d8"},
    {Match::Whole, "Battery data upload failed", "e69e165d5e8a47cdbd79d92461205fa6"},
    {Match::Whole, "Main Unchanged boot UUID. Skipping battery model task",
     "18dc70efb8364716800c53c93c076e60"},
    {Match::Whole, "Unable to get current boot UUID", "e7afee917bdd4f7880d33bc377b21dae"},
    {Match::Whole, "Could not allocate defaults", "e6742265263149679626216bcbb6bd9a"},
    {Match::Whole, "kolvrand failed to start", "d58ee42635b240aab08e6871a93c60a7"},
    // Both readers of the battery's data say it alike.
    {Match::End, "] <Error> powerService null", "dcf3ecf1db6c405faf31d1f536444904"},
    {Match::Start,
     "-[BatteryModelDataHandler getBatteryModelFileURLString:] <Error> file not present: ",
     "36160eb5171d44c0acc7be3ccb96944c"},
    {Match::Whole,
     "-[BatteryModelDataHandler moveBatteryModelDataFromDiskToKext:] <Error> protobufModel nil",
     "50b4020d7c4a4883bc8624b3598dcb73"},
    {Match::Whole,
     "-[BatteryModelDataHandler moveBatteryModelDataFromDiskToKext:] <Error> kextModel nil",
     "50b4020d7c4a4883bc8624b3598dcb73"},
    {Match::Whole,
     "-[BatteryModelDataHandler setBatteryModelDataToKernel:] <Error> no io service get matched",
     "e7b40f3b5d2145ef956dd672c8e9257e"},
    {Match::Start,
     "-[BatteryModelDataHandler setBatteryModelDataToKernel:] <Error> IOServiceOpen fail to "
     "connect, ioReturnResult = ",
     "aa1ccc1dbfcc467489e3efc1a30cecfe"},
    {Match::Start,
     "-[BatteryModelDataHandler setBatteryModelDataToKernel:] <Error> IOConnectCallStructMethod "
     "fail to call IOUserClient setBatteryParams,  ioReturnResult = ",
     "217fc5b5b8214dee861bec969d95aa9c"},
    {Match::Whole,
     "-[BatteryModelDataHandler setBatteryModelDataToKernel:] <Error> hash verify failed",
     "424f291208cb4090bba73fa8e60aa353"},
};

}  // namespace

std::string_view messageIDFor(std::string_view message) {
  if (!message.empty() && message.back() == '\n') message.remove_suffix(1);
  for (const Row& row : kRows) {
    const bool hit = row.match == Match::Whole   ? message == row.text
                     : row.match == Match::Start ? message.starts_with(row.text)
                                                 : message.ends_with(row.text);
    if (hit) return row.id;
  }
  return {};
}

}  // namespace kolvrand
