// What a protocol service needs of a server of byte-stream sessions, whatever carries them (plain
// TCP, SSH channels): listeners named by a tag, sessions named by a TcpSessionId carrying that
// tag, bytes in through TcpSessionEvents and out through Send. The threading rules of TcpServer
// hold for every implementation.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace tessel {

// A session's id: its listener's tag in the upper 32 bits and the server's running client number
// in the lower ones, so ids of different tags never meet.
using TcpSessionId = std::uint64_t;

inline constexpr TcpSessionId MakeTcpSessionId(std::uint32_t tag, std::uint32_t clientNumber) {
  return static_cast<TcpSessionId>(tag) << 32 | clientNumber;
}
inline constexpr std::uint32_t TcpListenerTagOf(TcpSessionId id) {
  return static_cast<std::uint32_t>(id >> 32);
}
inline constexpr std::uint32_t TcpClientNumberOf(TcpSessionId id) {
  return static_cast<std::uint32_t>(id);
}

struct TcpPeer {
  std::string address;  // numeric text
  std::uint16_t port = 0;
  std::uint16_t localPort = 0;  // the port of the listener that accepted the session
};

// Implemented by the protocol service that owns the sessions; called on the server's thread.
class TcpSessionEvents {
 public:
  virtual ~TcpSessionEvents() = default;
  virtual void OnAccepted(TcpSessionId session, std::uint32_t listenerTag, const TcpPeer& peer) = 0;
  // The bytes of one read; a protocol message may span several reads or share one.
  virtual void OnBytes(TcpSessionId session, std::string_view bytes) = 0;
  // The peer ended its input (it may still be reading): no OnBytes follows. True when answers to
  // what it sent are still to come and the service closes the session itself once they are sent
  // (Close with afterPendingOutput); false lets the server close it once its queued output is
  // written. A half-closed session is closed after a short bound all the same.
  virtual bool OnInputEnded(TcpSessionId) { return false; }
  // After the OnBytes calls of one round of ready sessions: a service may gather the messages of
  // a round and hand them on together here, with one wake-up of its workers instead of one per
  // message. A server calls it at least after every round that made an OnBytes call.
  virtual void OnReadsDone() {}
  // The session is gone (peer close or reset, read or write error, keep-alive expiry, output
  // past the cap, Close, CloseListeners or Stop); Send to it returns false from now on.
  virtual void OnClosed(TcpSessionId session) = 0;
};

class StreamServer {
 public:
  virtual ~StreamServer() = default;
  // Listens on address:port (numeric IPv4 or IPv6 text); tag names the listener in its sessions'
  // ids. A session is closed when silent for keepAliveSeconds (0 never). False with *error (when
  // given) set to the errno of the failing step.
  virtual bool Listen(std::uint32_t tag, const std::string& address, std::uint16_t port,
                      std::uint32_t keepAliveSeconds, int* error = nullptr) = 0;
  // Closes every listener and session of tag; the ports are free on return.
  virtual void CloseListeners(std::uint32_t tag) = 0;
  // Queues bytes for the session; false when it is gone or closing, or past the output cap.
  virtual bool Send(TcpSessionId session, std::string bytes) = 0;
  // Closes the session; with afterPendingOutput once its queued output is written.
  virtual void Close(TcpSessionId session, bool afterPendingOutput) = 0;
  virtual std::vector<TcpSessionId> SessionsOf(std::uint32_t tag) const = 0;
  virtual std::size_t SessionCount() const = 0;
  // Closes every listener and session and ends the server's threads; it may listen again later.
  virtual void Stop() = 0;
};

}  // namespace tessel
