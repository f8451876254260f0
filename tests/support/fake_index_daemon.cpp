#include "tests/support/fake_index_daemon.h"

#include <sys/socket.h>
#include <unistd.h>

#include <cstring>

#include "common/json_util.h"
#include "sdk/frame.h"

namespace vellis::testing {

FakeIndexDaemon::FakeIndexDaemon(const std::string& path) : FakeUnixServer(path) {
  const std::string ok = R"({"success":true})";
  answer_ = sdk::EncodeFrameHeader(static_cast<uint32_t>(ok.size())) + ok;
  Start();
}

FakeIndexDaemon::~FakeIndexDaemon() { Stop(); }

void FakeIndexDaemon::SetAnswerBytes(const std::string& bytes) {
  std::lock_guard<std::mutex> lock(mu_);
  answer_ = bytes;
}

void FakeIndexDaemon::SetCloseAfterAnswer(bool close_after_answer) {
  std::lock_guard<std::mutex> lock(mu_);
  close_after_answer_ = close_after_answer;
}

void FakeIndexDaemon::SetNeverRead(bool never_read) {
  std::lock_guard<std::mutex> lock(mu_);
  never_read_ = never_read;
}

std::vector<Json::Value> FakeIndexDaemon::Commands() const {
  std::lock_guard<std::mutex> lock(mu_);
  return commands_;
}

bool FakeIndexDaemon::ReadExact(int fd, char* data, size_t size) {
  size_t done = 0;
  while (done < size) {
    if (!WaitReadable(fd, 2000)) return false;
    ssize_t n = read(fd, data + done, size - done);
    if (n <= 0) return false;
    done += static_cast<size_t>(n);
  }
  return true;
}

void FakeIndexDaemon::Serve(int fd) {
  std::string answer;
  bool never_read;
  bool close_after_answer;
  {
    std::lock_guard<std::mutex> lock(mu_);
    answer = answer_;
    never_read = never_read_;
    close_after_answer = close_after_answer_;
  }
  if (never_read) {
    // Hold the connection until the client gives up and hangs up; its data
    // stays unread in the socket buffer.
    while (WaitReadable(fd, 2000)) {
      char sink;
      if (recv(fd, &sink, 1, MSG_PEEK | MSG_DONTWAIT) == 0) break;
      if (!Pause(10)) break;
    }
    close(fd);
    return;
  }
  char header[sdk::kFrameHeaderSize];
  uint32_t length = 0;
  if (ReadExact(fd, header, sizeof(header))) {
    memcpy(&length, header, sizeof(length));
    std::string text(length, '\0');
    if (length <= sdk::kMaxMessageSize && ReadExact(fd, &text[0], length)) {
      Json::Value command;
      if (!JsonFromString(command, text)) command = Json::Value();
      {
        std::lock_guard<std::mutex> lock(mu_);
        commands_.push_back(command);
      }
      (void)!send(fd, answer.data(), answer.size(), MSG_NOSIGNAL);
      if (!close_after_answer) WaitReadable(fd, 2000);
    }
  }
  close(fd);
}

}  // namespace vellis::testing
