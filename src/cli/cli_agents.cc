#include "cli/cli_agents.h"

#include <vector>

namespace tessel {

std::uint32_t CliAgents::Register(CliAgent agent) {
  std::lock_guard<std::mutex> lock(mutex_);
  auto key = std::make_pair(agent.ipAddress, agent.port);
  auto at = agentAt_.find(key);
  if (at != agentAt_.end()) agents_.erase(at->second);
  // Listener tags are 32-bit and never 0; a wrap would take billions of registrations.
  if (nextId_ == 0) nextId_ = 1;
  agent.id = nextId_++;
  agentAt_[key] = agent.id;
  std::uint32_t id = agent.id;
  agents_[id] = std::move(agent);
  return id;
}

std::optional<CliAgent> CliAgents::Find(std::uint32_t id) const {
  std::lock_guard<std::mutex> lock(mutex_);
  auto found = agents_.find(id);
  if (found == agents_.end()) return std::nullopt;
  return found->second;
}

std::optional<CliAgent> CliAgents::FindAt(const std::string& address, std::uint16_t port) const {
  std::lock_guard<std::mutex> lock(mutex_);
  auto at = agentAt_.find({address, port});
  if (at == agentAt_.end()) return std::nullopt;
  return agents_.at(at->second);
}

bool CliAgents::Update(std::uint32_t id, const std::function<void(CliAgent&)>& change) {
  std::lock_guard<std::mutex> lock(mutex_);
  auto found = agents_.find(id);
  if (found == agents_.end()) return false;
  change(found->second);
  return true;
}

std::optional<std::uint32_t> CliAgents::Forget(const std::string& address, std::uint16_t port) {
  std::lock_guard<std::mutex> lock(mutex_);
  auto at = agentAt_.find({address, port});
  if (at == agentAt_.end()) return std::nullopt;
  std::uint32_t id = at->second;
  agents_.erase(id);
  agentAt_.erase(at);
  return id;
}

void CliAgents::Clear() {
  std::lock_guard<std::mutex> lock(mutex_);
  agents_.clear();
  agentAt_.clear();
}

}  // namespace tessel
