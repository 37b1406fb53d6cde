// SPDX-License-Identifier: MIT
// Upload of the record to the kernel driver's "setBatteryParams" method and
// its confirmation against the hash the driver publishes.
#include <algorithm>
#include <cstring>

#include "base/CommonCrypto.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/KextBatteryModel.h"
#include "platform/IOKit.h"

namespace kolvrand {

namespace {

using namespace kvr_driver;
static_assert(sizeof(KextBatteryModel) == kBatteryParamsSize);

// Closes the user-client connection on every way out of the upload.
class ConnectionGuard {
 public:
  explicit ConnectionGuard(io_connect_t& connection) : connection_(connection) {}
  ~ConnectionGuard() {
    if (connection_) IOServiceClose(connection_);
  }
  ConnectionGuard(const ConnectionGuard&) = delete;
  ConnectionGuard& operator=(const ConnectionGuard&) = delete;

 private:
  io_connect_t& connection_;
};

}  // namespace

bool BatteryModelDataHandler::setBatteryModelDataToKernel(const KextBatteryModel* kextModel) {
  static constexpr const char* kMethod = "-[BatteryModelDataHandler setBatteryModelDataToKernel:]";
  io_connect_t connection = 0;
  ConnectionGuard closeOnReturn(connection);
  SHA1Digest sentHash{};

  if (!kextModel) {
    os_log_error(log_, "%s <Error> kextModel nil", kMethod);
    return false;
  }
  CC_SHA1_CTX context;
  CC_SHA1_Init(&context);
  CC_SHA1_Update(&context, kextModel, sizeof(KextBatteryModel));
  CC_SHA1_Final(sentHash.data(), &context);

  io_service_t service =
      IOServiceGetMatchingService(kIOMasterPortDefault, IOServiceMatching(kServiceClass));
  if (!service) {
    os_log_error(log_, "%s <Error> no io service get matched", kMethod);
    return false;
  }
  kern_return_t result = IOServiceOpen(service, mach_task_self(), 0, &connection);
  if (result != KERN_SUCCESS) {
    connection = 0;
    os_log_error(log_, "%s <Error> IOServiceOpen fail to connect, ioReturnResult = %d", kMethod,
                 result);
    return false;
  }
  result = IOConnectCallStructMethod(connection, kSetBatteryParamsSelector, kextModel,
                                     sizeof(KextBatteryModel), nullptr, nullptr);
  if (result != KERN_SUCCESS) {
    os_log_error(log_,
                 "%s <Error> IOConnectCallStructMethod fail to call IOUserClient "
                 "setBatteryParams,  ioReturnResult = %d",
                 kMethod, result);
    return false;
  }
  // The driver publishes the hash as it accepts the record: no wait, no retry.
  if (!verifyHashData(sentHash.data())) {
    os_log_error(log_, "%s <Error> hash verify failed", kMethod);
    return false;
  }
  return true;
}

bool BatteryModelDataHandler::verifyHashData(const uint8_t* sentHash) {
  static constexpr const char* kMethod = "-[BatteryModelDataHandler verifyHashData:]";
  SHA1Digest returnedHash{};
  std::optional<Dictionary> kvrVector;

  if (!getKVRDebugDict(&kvrVector) || !kvrVector) {
    os_log_error(log_, "%s <Error> getKVRDebugDict failed", kMethod);
    return false;
  }
  // Entries of another type than the driver's contract count as absent.
  const Value* battModel = kvrVector->find(kBatteryModelKey);
  if (!battModel || !battModel->isDictionary()) {
    os_log_error(log_, "%s <Error> battModelDict nil", kMethod);
    return false;
  }
  const Value* published = battModel->asDictionary()->find(kParamsHashKey);
  if (!published || !published->isData()) {
    os_log_error(log_, "%s <Error> RCParamsHash nil", kMethod);
    return false;
  }
  // A longer hash is no SHA-1 of the record: a mismatch, though only its
  // first 20 bytes are taken.
  const Data& bytes = *published->asData();
  if (!bytes.empty())
    std::memcpy(returnedHash.data(), bytes.data(), std::min(bytes.size(), returnedHash.size()));
  if (bytes.size() <= returnedHash.size() &&
      std::equal(returnedHash.begin(), returnedHash.end(), sentHash)) {
    return true;
  }
  os_log_error(log_, "%s <Error> sentHash %x mismatches with returnedHash %x", kMethod,
               unsigned{sentHash[0]}, unsigned{returnedHash[0]});
  return false;
}

bool BatteryModelDataHandler::getKVRDebugDict(std::optional<Dictionary>* dict) {
  io_service_t service =
      IOServiceGetMatchingService(kIOMasterPortDefault, IOServiceMatching(kServiceClass));
  if (!service) return false;
  std::optional<Value> kvrVector = IORegistryEntryCreateCFProperty(service, kVectorProperty);
  if (!kvrVector || !kvrVector->isDictionary()) return false;
  *dict = std::move(*kvrVector->asDictionary());
  return true;
}

}  // namespace kolvrand
