// A fake indexing daemon on its command socket: reads each framed command,
// records it and answers with a frame (by default {"success":true}).
#pragma once

#include <json/json.h>

#include <mutex>
#include <string>
#include <vector>

#include "tests/support/fake_unix_server.h"

namespace vellis::testing {

class FakeIndexDaemon : public FakeUnixServer {
 public:
  // Serves at `path` (normally RootPath(kFileIndexDaemonSocketPath)) at once.
  explicit FakeIndexDaemon(const std::string& path);
  ~FakeIndexDaemon() override;

  // The bytes written back after a command has been read (a whole frame
  // normally; anything for fault tests).
  void SetAnswerBytes(const std::string& bytes);
  // When set, the connection is closed right after the answer; otherwise it
  // stays open until the client hangs up (so a short answer leaves the
  // client waiting for the rest).
  void SetCloseAfterAnswer(bool close_after_answer);
  // When set, connections are accepted but nothing is ever read from them.
  void SetNeverRead(bool never_read);

  // Commands read, in order (null for one that was not JSON).
  std::vector<Json::Value> Commands() const;

 protected:
  void Serve(int fd) override;

 private:
  // Reads exactly `size` bytes; false on end of stream, error or Stop().
  bool ReadExact(int fd, char* data, size_t size);

  mutable std::mutex mu_;
  std::string answer_;
  bool never_read_ = false;
  bool close_after_answer_ = false;
  std::vector<Json::Value> commands_;
};

}  // namespace vellis::testing
