// The command channel to the package's indexing daemon.
//
// One Unix-domain stream connection per command carries one framed message
// each way (sdk/frame.h: 4-byte length in host byte order, then JSON text).
// The command is {"type": <name>, "data": <argument>}; docs/protocol.md
// lists the commands and the answer. Reentrant: no shared state.
#pragma once

#include <json/json.h>

#include <string>

namespace vellis::fileindex {

// The indexing daemon's socket; resolved with RootPath() at use.
inline constexpr char kFileIndexDaemonSocketPath[] = "/var/run/fileindexd.sock";

// Connection attempts while the socket file is missing, one second apart.
inline constexpr int kCommandConnectAttempts = 5;
// A daemon that does not take a command (or the connection) within this
// time is not waited for.
inline constexpr int kCommandSendTimeoutMs = 1000;
// A daemon that does not answer within this time is taken as hung.
inline constexpr int kCommandRecvTimeoutMs = 10000;

// Sends the command `type` with argument `data` and returns the daemon's
// answer text, read whole and not interpreted.
//
// While the socket file is missing (ENOENT) the connection is tried up to
// kCommandConnectAttempts times with a one-second sleep (through the
// platform) between attempts; another connect error ends the attempts at
// once. A connection that could not be made fails in the transfer that
// follows. Throws Error 502 for every failure: the socket or its options,
// the transfer (see BufferWrite / BufferRead), a command text longer than
// sdk::kMaxMessageSize, or an answer whose announced length is 0 or above
// sdk::kMaxMessageSize (refused before allocating). The socket is closed on
// every path.
std::string SendCommandToDaemon(const std::string& type, const Json::Value& data);

// Writes exactly `length` bytes of `buffer` to `fd`, in pieces of at most
// 1024 bytes, retrying on EINTR; a socket is written without SIGPIPE.
// Returns at once for length 0. Throws Error 502 "write failed,
// reason=<system text>" on any other failure (a send time-out included).
void BufferWrite(int fd, unsigned int length, const unsigned char* buffer);

// Reads exactly `length` bytes from `fd` into `buffer`, in pieces of at most
// 1024 bytes, retrying on EINTR. Returns at once for length 0. Throws Error
// 502 "read failed, reason=<system text>" on failure, and with the reason
// "read failed, reason=end of stream" when the peer closes early.
void BufferRead(int fd, unsigned int length, unsigned char* buffer);

// Transfer time-outs of SendCommandToDaemon in milliseconds.
struct CommandTimeouts {
  int send_ms;
  int recv_ms;
};

// Test-only: replaces the time-outs of SendCommandToDaemon and returns the
// previous ones.
CommandTimeouts TEST_SetCommandTimeouts(CommandTimeouts timeouts);

}  // namespace vellis::fileindex
