// A fake platform for the management operations: service control and the
// file-sharing search switch are recorded and scripted instead of acting on
// the machine; the monitor configuration is written by the real Linux code
// (under the test's root) so that tests can read it back.
#pragma once

#include <json/json.h>

#include <string>
#include <vector>

#include "tests/support/fake_share_platform.h"

namespace vellis::testing {

class FakeServicesPlatform : public FakeSharePlatform {
 public:
  // One service request: the call's name ("QLIBServiceStart", ...) and the
  // service.
  struct ServiceCall {
    std::string call, service;
    bool operator==(const ServiceCall& o) const { return call == o.call && service == o.service; }
  };

  // The search-support switch as the service's configuration has it.
  void SetSpotlight(bool on) { Set(spotlight_, on); }
  bool Spotlight() const { return Get(spotlight_); }
  // Service requests and switch changes ("QORUSMBSetSpotlight" with service
  // "1" or "0"), in order. Calls named in FailCall (with the service as
  // argument) fail with its error and are recorded too.
  std::vector<ServiceCall> ServiceCalls() const { return Get(service_calls_); }
  void ClearServiceCalls() { Set(service_calls_, {}); }
  // The failure site that QLIBCErrorGetFile / Line report.
  void SetErrorSite(const std::string& file, int line) { Set(error_site_, {file, line}); }

  // The recycle bins that the home enumerations report.
  void SetHomeRecyclePaths(std::vector<std::string> paths) { Set(home_recycle_paths_, paths); }
  // The account sources asked for, in order.
  std::vector<int> AuthTypes() const { return Get(auth_types_); }

  // Sleeps stay fake; USleep really waits the asked time divided by
  // `divisor` once this is set (0: fake again), for processes that contend
  // for a lock file.
  void SetRealUSleep(uint64_t divisor) { Set(usleep_divisor_, divisor); }
  void USleep(uint64_t microseconds) override {
    uint64_t divisor = Get(usleep_divisor_);
    if (divisor == 0) return FakeSharePlatform::USleep(microseconds);
    target()->USleep(microseconds / divisor);
  }

  int QLIBServiceStart(const std::string& s, bool) override {
    return Service("QLIBServiceStart", s);
  }
  int QLIBServiceStop(const std::string& s, bool) override { return Service("QLIBServiceStop", s); }
  int QLIBServiceRestart(const std::string& s) override { return Service("QLIBServiceRestart", s); }
  int QLIBServicectlStart(const std::string& s, int) override {
    return Service("QLIBServicectlStart", s);
  }
  int QLIBServicectlStop(const std::string& s, int) override {
    return Service("QLIBServicectlStop", s);
  }
  int QORUSMBIsEnableSpotlight() override { return Spotlight() ? 1 : 0; }
  int QORUSMBSetSpotlight(int enable) override {
    if (Service("QORUSMBSetSpotlight", enable ? "1" : "0") < 0) return -1;
    SetSpotlight(enable != 0);
    return 0;
  }
  std::string QLIBCErrorGetFile() override { return Get(error_site_).first; }
  int QLIBCErrorGetLine() override { return Get(error_site_).second; }
  // Scripted failures ("MonitorQueueUpsert" / "MonitorQueueDelete", with the
  // queue path as argument) answer false; the others write the file.
  bool MonitorQueueUpsert(const Json::Value& queue, const std::string& app, int type) override {
    return !Fails("MonitorQueueUpsert", queue.isObject() ? queue["queue"].asString() : "") &&
           FakeSharePlatform::MonitorQueueUpsert(queue, app, type);
  }
  bool MonitorQueueDelete(const std::string& queue_path, const std::string& app,
                          int type) override {
    return !Fails("MonitorQueueDelete", queue_path) &&
           FakeSharePlatform::MonitorQueueDelete(queue_path, app, type);
  }
  int QORURecycleHomeEnumRecyclePathForAuthType(std::vector<std::string>* paths,
                                                int auth_type) override {
    bool fails = Fails("QORURecycleHomeEnumRecyclePathForAuthType", "");
    Locked([&] { auth_types_.push_back(auth_type); });
    return fails ? -1 : AddHomeRecyclePaths(paths);
  }
  int QORURecycleHomeEnumRecyclePath(std::vector<std::string>* paths) override {
    return Fails("QORURecycleHomeEnumRecyclePath", "") ? -1 : AddHomeRecyclePaths(paths);
  }

 private:
  int Service(const std::string& call, const std::string& service) {
    bool fails = Fails(call, service);
    Locked([&] { service_calls_.push_back({call, service}); });
    return fails ? -1 : 0;
  }
  int AddHomeRecyclePaths(std::vector<std::string>* paths) {
    std::vector<std::string> add = Get(home_recycle_paths_);
    paths->insert(paths->end(), add.begin(), add.end());
    return 0;
  }

  bool spotlight_ = false;
  std::vector<ServiceCall> service_calls_;
  std::pair<std::string, int> error_site_{"", 0};
  std::vector<std::string> home_recycle_paths_;
  std::vector<int> auth_types_;
  uint64_t usleep_divisor_ = 0;
};

}  // namespace vellis::testing
