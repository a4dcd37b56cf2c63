#include "options.h"

#include <arpa/inet.h>
#include <sched.h>

#include <algorithm>
#include <charconv>
#include <cstdlib>

namespace tessel::bench {
namespace {

constexpr std::size_t kMaxTargets = 1000000;

bool IsLoopback(std::uint32_t hostOrder) { return (hostOrder >> 24) == 127; }

bool AppendRange(const std::string& item, std::uint16_t port, std::vector<sockaddr_in>* out) {
  const std::size_t plus = item.find('+');
  const std::string address = item.substr(0, plus);
  int count = 1;
  if (plus != std::string::npos &&
      !ParseInt(item.substr(plus + 1), 1, static_cast<int>(kMaxTargets), &count)) {
    return false;
  }
  in_addr first{};
  if (inet_pton(AF_INET, address.c_str(), &first) != 1) return false;
  const std::uint32_t base = ntohl(first.s_addr);
  if (!IsLoopback(base) || !IsLoopback(base + static_cast<std::uint32_t>(count - 1))) return false;
  if (out->size() + static_cast<std::size_t>(count) > kMaxTargets) return false;
  for (int i = 0; i < count; ++i) {
    sockaddr_in target{};
    target.sin_family = AF_INET;
    target.sin_port = htons(port);
    target.sin_addr.s_addr = htonl(base + static_cast<std::uint32_t>(i));
    out->push_back(target);
  }
  return true;
}

}  // namespace

bool ParseInt(const std::string& text, int low, int high, int* out) {
  int value = 0;
  auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
  if (error != std::errc() || end != text.data() + text.size() || value < low || value > high)
    return false;
  *out = value;
  return true;
}

bool ParseSeconds(const std::string& text, double low, double high, double* out) {
  char* end = nullptr;
  const double value = std::strtod(text.c_str(), &end);
  if (text.empty() || *end != '\0' || !(value >= low && value <= high)) return false;
  *out = value;
  return true;
}

bool ParsePort(const std::string& text, std::uint16_t* out) {
  int port = 0;
  if (!ParseInt(text, 1, 65535, &port)) return false;
  *out = static_cast<std::uint16_t>(port);
  return true;
}

bool ParseTargets(const std::string& text, std::uint16_t port, std::vector<sockaddr_in>* out) {
  out->clear();
  std::size_t start = 0;
  while (start <= text.size()) {
    const std::size_t comma = std::min(text.find(',', start), text.size());
    if (!AppendRange(text.substr(start, comma - start), port, out)) return false;
    start = comma + 1;
  }
  return !out->empty();
}

bool PinToCpu(int cpu) {
  cpu_set_t set;
  CPU_ZERO(&set);
  CPU_SET(cpu, &set);
  return sched_setaffinity(0, sizeof set, &set) == 0;
}

}  // namespace tessel::bench
