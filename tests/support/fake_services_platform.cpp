#include "tests/support/fake_services_platform.h"

#include <json/json.h>

#include <cerrno>

namespace vellis::testing {

void FakeServicesPlatform::SetSpotlight(bool on) {
  std::lock_guard<std::mutex> lock(mu_);
  spotlight_ = on;
}

bool FakeServicesPlatform::Spotlight() const {
  std::lock_guard<std::mutex> lock(mu_);
  return spotlight_;
}

std::vector<FakeServicesPlatform::ServiceCall> FakeServicesPlatform::ServiceCalls() const {
  std::lock_guard<std::mutex> lock(mu_);
  return service_calls_;
}

void FakeServicesPlatform::ClearServiceCalls() {
  std::lock_guard<std::mutex> lock(mu_);
  service_calls_.clear();
}

void FakeServicesPlatform::SetErrorSite(const std::string& file, int line) {
  std::lock_guard<std::mutex> lock(mu_);
  error_file_ = file;
  error_line_ = line;
}

void FakeServicesPlatform::SetHomeRecyclePaths(std::vector<std::string> paths) {
  std::lock_guard<std::mutex> lock(mu_);
  home_recycle_paths_ = std::move(paths);
}

std::vector<int> FakeServicesPlatform::AuthTypes() const {
  std::lock_guard<std::mutex> lock(mu_);
  return auth_types_;
}

void FakeServicesPlatform::SetRealUSleep(uint64_t divisor) {
  std::lock_guard<std::mutex> lock(mu_);
  usleep_divisor_ = divisor;
}

void FakeServicesPlatform::USleep(uint64_t microseconds) {
  uint64_t divisor;
  {
    std::lock_guard<std::mutex> lock(mu_);
    divisor = usleep_divisor_;
  }
  if (divisor == 0) {
    FakeSharePlatform::USleep(microseconds);
  } else {
    target()->USleep(microseconds / divisor);
  }
}

int FakeServicesPlatform::Service(const std::string& call, const std::string& service) {
  bool fails = Fails(call, service);
  std::lock_guard<std::mutex> lock(mu_);
  service_calls_.push_back({call, service});
  return fails ? -1 : 0;
}

int FakeServicesPlatform::QLIBServiceStart(const std::string& service, bool /*wait*/) {
  return Service("QLIBServiceStart", service);
}

int FakeServicesPlatform::QLIBServiceStop(const std::string& service, bool /*wait*/) {
  return Service("QLIBServiceStop", service);
}

int FakeServicesPlatform::QLIBServiceRestart(const std::string& service) {
  return Service("QLIBServiceRestart", service);
}

int FakeServicesPlatform::QLIBServicectlStart(const std::string& service, int /*type*/) {
  return Service("QLIBServicectlStart", service);
}

int FakeServicesPlatform::QLIBServicectlStop(const std::string& service, int /*type*/) {
  return Service("QLIBServicectlStop", service);
}

int FakeServicesPlatform::QORUSMBIsEnableSpotlight() {
  std::lock_guard<std::mutex> lock(mu_);
  return spotlight_ ? 1 : 0;
}

int FakeServicesPlatform::QORUSMBSetSpotlight(int enable) {
  if (Service("QORUSMBSetSpotlight", enable ? "1" : "0") < 0) return -1;
  std::lock_guard<std::mutex> lock(mu_);
  spotlight_ = enable != 0;
  return 0;
}

std::string FakeServicesPlatform::QLIBCErrorGetFile() {
  std::lock_guard<std::mutex> lock(mu_);
  return error_file_;
}

int FakeServicesPlatform::QLIBCErrorGetLine() {
  std::lock_guard<std::mutex> lock(mu_);
  return error_line_;
}

bool FakeServicesPlatform::MonitorQueueUpsert(const Json::Value& queue, const std::string& app,
                                              int type) {
  const std::string path = queue.isObject() ? queue["queue"].asString() : "";
  if (Fails("MonitorQueueUpsert", path)) return false;
  return FakeSharePlatform::MonitorQueueUpsert(queue, app, type);
}

bool FakeServicesPlatform::MonitorQueueDelete(const std::string& queue_path, const std::string& app,
                                              int type) {
  if (Fails("MonitorQueueDelete", queue_path)) return false;
  return FakeSharePlatform::MonitorQueueDelete(queue_path, app, type);
}

int FakeServicesPlatform::QORURecycleHomeEnumRecyclePathForAuthType(std::vector<std::string>* paths,
                                                                    int auth_type) {
  bool fails = Fails("QORURecycleHomeEnumRecyclePathForAuthType", "");
  std::lock_guard<std::mutex> lock(mu_);
  auth_types_.push_back(auth_type);
  if (fails) return -1;
  paths->insert(paths->end(), home_recycle_paths_.begin(), home_recycle_paths_.end());
  return 0;
}

int FakeServicesPlatform::QORURecycleHomeEnumRecyclePath(std::vector<std::string>* paths) {
  if (Fails("QORURecycleHomeEnumRecyclePath", "")) return -1;
  std::lock_guard<std::mutex> lock(mu_);
  paths->insert(paths->end(), home_recycle_paths_.begin(), home_recycle_paths_.end());
  return 0;
}

}  // namespace vellis::testing
