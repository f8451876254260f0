#include "sdk/socket_io.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <string>
#include <thread>

#include "sdk/frame.h"

namespace vellis::sdk {
namespace {

// Both ends of a stream socket, or of a pipe (which is not a socket).
struct Ends {
  explicit Ends(bool socket) {
    int fds[2];
    int rc =
        socket ? socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, fds) : pipe2(fds, O_CLOEXEC);
    EXPECT_EQ(rc, 0);
    in = fds[0];
    out = fds[1];
  }
  ~Ends() {
    if (in >= 0) close(in);
    if (out >= 0) close(out);
  }
  int in = -1;   // read here
  int out = -1;  // write here
};

TEST(SocketIoTest, FramesCrossSocketsAndPipesWhole) {
  for (bool socket : {true, false}) {
    for (size_t size : {size_t{1}, size_t{65536}, size_t{70000}, size_t{1} << 20}) {
      Ends ends(socket);
      const std::string text(size, socket ? 's' : 'p');
      std::string got;
      std::string why;
      std::thread reader([&] {
        IoResult r = ReadFrame(ends.in, &got, DeadlineAfter(5000), &why);
        EXPECT_EQ(r.status, IoStatus::kOk) << IoResultText(r);
        EXPECT_EQ(r.done, size + kFrameHeaderSize);
      });
      IoResult w = WriteFrame(ends.out, text, DeadlineAfter(5000));
      EXPECT_EQ(w.status, IoStatus::kOk) << size << " " << IoResultText(w);
      reader.join();
      EXPECT_EQ(got, text) << "socket=" << socket << " size=" << size;
    }
  }
}

TEST(SocketIoTest, EveryFailureHasItsStatus) {
  std::string why;
  std::string got = "old";
  {
    Ends ends(true);
    close(ends.out);
    ends.out = -1;
    EXPECT_EQ(ReadFrame(ends.in, &got, DeadlineAfter(1000), &why).status, IoStatus::kClosed);
  }
  {
    Ends ends(true);
    const std::string part = EncodeFrameHeader(10) + "{\"a\"";
    ASSERT_EQ(write(ends.out, part.data(), part.size()), static_cast<ssize_t>(part.size()));
    close(ends.out);
    ends.out = -1;
    IoResult r = ReadFrame(ends.in, &got, DeadlineAfter(1000), &why);
    EXPECT_EQ(r.status, IoStatus::kTruncated);
    EXPECT_EQ(IoResultText(r), "connection lost inside a message, after 8 bytes");
    EXPECT_EQ(got, "") << "a partial message is not handed out";
  }
  {
    Ends ends(true);
    IoResult r = ReadFrame(ends.in, &got, DeadlineAfter(50), &why);
    EXPECT_EQ(r.status, IoStatus::kTimeout);
    const std::string bad = EncodeFrameHeader(0);
    ASSERT_EQ(write(ends.out, bad.data(), bad.size()), 4);
    EXPECT_EQ(ReadFrame(ends.in, &got, DeadlineAfter(1000), &why).status, IoStatus::kBadLength);
    EXPECT_NE(why.find("length is 0"), std::string::npos) << why;
  }
  {
    Ends ends(true);
    EXPECT_EQ(WriteFrame(ends.out, "", -1).status, IoStatus::kBadLength) << "empty text";
    close(ends.in);
    ends.in = -1;
    IoResult r = WriteFrame(ends.out, "{}", DeadlineAfter(1000));  // no SIGPIPE
    EXPECT_EQ(r.status, IoStatus::kError);
    EXPECT_EQ(r.error, EPIPE);
    EXPECT_EQ(IoResultText(r), "Broken pipe");
  }
}

TEST(SocketIoTest, APeerThatNeverReadsEndsTheWriteAtItsDeadline) {
  Ends ends(true);
  const std::string big(8 << 20, 'x');
  IoResult r = WriteExact(ends.out, big.data(), big.size(), {0, DeadlineAfter(100)});
  EXPECT_EQ(r.status, IoStatus::kTimeout);
  EXPECT_GT(r.done, 0u);
  EXPECT_LT(r.done, big.size());
}

}  // namespace
}  // namespace vellis::sdk
