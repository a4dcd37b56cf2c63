// The CLI agents the host registered: each with its one login user, enable secret, host texts
// and device name, found by the id the service gives it (the listener tag of its sessions) or by
// its address and port. A session looks its agent up by id, so agents stopped or registered in
// between never lend it another's user. Ids are never reused. Thread-safe; records are handed
// out as copies, and the fields that change at run time change through Update.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace tessel {

struct CliAgent {
  std::uint32_t id = 0;
  std::string userName;
  std::string password;
  std::string enablePassword;
  bool enableByTelnet = false;  // `enable` asks for the secret
  std::string ipAddress;
  std::uint16_t port = 0;
  std::string hostText1, hostText2, hostText3, hostText4;
  std::string deviceName;
  std::int32_t hostNumber = 0;
  std::int32_t hostInt = 0;
  bool telnetServer = false;  // a shell-like plain Telnet server rather than a router CLI
  std::uint32_t keepAliveSeconds = 300;
  std::int32_t hostInt1 = 0, hostInt2 = 0;  // from the start call, kept for the host
};

class CliAgents {
 public:
  // Registers agent (its id is ignored), replacing the one at the same address and port;
  // returns the new id.
  std::uint32_t Register(CliAgent agent);
  std::optional<CliAgent> Find(std::uint32_t id) const;
  std::optional<CliAgent> FindAt(const std::string& address, std::uint16_t port) const;
  // Runs change on the agent's record under the lock; false when there is no such agent.
  bool Update(std::uint32_t id, const std::function<void(CliAgent&)>& change);
  // Forgets the agent at address:port and returns its id.
  std::optional<std::uint32_t> Forget(const std::string& address, std::uint16_t port);
  void Clear();

 private:
  mutable std::mutex mutex_;
  std::map<std::uint32_t, CliAgent> agents_;
  std::map<std::pair<std::string, std::uint16_t>, std::uint32_t> agentAt_;
  std::uint32_t nextId_ = 1;
};

}  // namespace tessel
