// A fake platform for the management operations: service control and the
// file-sharing search switch are recorded and scripted instead of acting on
// the machine; the monitor configuration is written by the real Linux code
// (under the test's root) so that tests can read it back.
#pragma once

#include <mutex>
#include <string>
#include <vector>

#include "tests/support/fake_share_platform.h"

namespace vellis::testing {

class FakeServicesPlatform : public FakeSharePlatform {
 public:
  // One service request: the call's name ("QLIBServiceStart", ...) and the
  // service.
  struct ServiceCall {
    std::string call;
    std::string service;
    bool operator==(const ServiceCall& o) const { return call == o.call && service == o.service; }
  };

  // The search-support switch as the service's configuration has it.
  void SetSpotlight(bool on);
  bool Spotlight() const;
  // Service requests and switch changes ("QORUSMBSetSpotlight" with service
  // "1" or "0"), in order. Calls named in FailCall (with the service as
  // argument) fail with its error and are recorded too.
  std::vector<ServiceCall> ServiceCalls() const;
  void ClearServiceCalls();
  // The failure site that QLIBCErrorGetFile / Line report.
  void SetErrorSite(const std::string& file, int line);

  // The recycle bins that the home enumerations report.
  void SetHomeRecyclePaths(std::vector<std::string> paths);
  // The account sources asked for, in order.
  std::vector<int> AuthTypes() const;

  // Sleeps stay fake; USleep really waits the asked time divided by
  // `divisor` once this is set (0: fake again), for processes that contend
  // for a lock file.
  void SetRealUSleep(uint64_t divisor);
  void USleep(uint64_t microseconds) override;

  int QLIBServiceStart(const std::string& service, bool wait) override;
  int QLIBServiceStop(const std::string& service, bool wait) override;
  int QLIBServiceRestart(const std::string& service) override;
  int QLIBServicectlStart(const std::string& service, int type) override;
  int QLIBServicectlStop(const std::string& service, int type) override;
  int QORUSMBIsEnableSpotlight() override;
  int QORUSMBSetSpotlight(int enable) override;
  std::string QLIBCErrorGetFile() override;
  int QLIBCErrorGetLine() override;
  // Scripted failures ("MonitorQueueUpsert" / "MonitorQueueDelete", with the
  // queue path as argument) answer false; the others write the file.
  bool MonitorQueueUpsert(const Json::Value& queue, const std::string& app, int type) override;
  bool MonitorQueueDelete(const std::string& queue_path, const std::string& app, int type) override;
  int QORURecycleHomeEnumRecyclePathForAuthType(std::vector<std::string>* paths,
                                                int auth_type) override;
  int QORURecycleHomeEnumRecyclePath(std::vector<std::string>* paths) override;

 private:
  int Service(const std::string& call, const std::string& service);

  mutable std::mutex mu_;
  bool spotlight_ = false;
  std::vector<ServiceCall> service_calls_;
  std::string error_file_;
  int error_line_ = 0;
  std::vector<std::string> home_recycle_paths_;
  std::vector<int> auth_types_;
  uint64_t usleep_divisor_ = 0;
};

}  // namespace vellis::testing
