#include "engine/host_bridge.h"

#include <atomic>

namespace tessel {
namespace {

std::atomic<HostBridge*> installedHost{nullptr};

}  // namespace

HostBridge* InstalledHost() { return installedHost.load(std::memory_order_acquire); }
void InstallHost(HostBridge* host) { installedHost.store(host, std::memory_order_release); }

}  // namespace tessel
