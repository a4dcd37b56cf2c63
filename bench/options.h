// Command-line helpers shared by the load generator and the echo server: bounded number
// parsing, loopback target lists and CPU pinning.
#pragma once

#include <netinet/in.h>

#include <cstdint>
#include <string>
#include <vector>

namespace tessel::bench {

// Walks argv as "--name [value]" pairs.
class ArgumentReader {
 public:
  ArgumentReader(int argc, char** argv) : argc_(argc), argv_(argv) {}
  bool Next(std::string* name) {
    if (index_ >= argc_) return false;
    *name = argv_[index_++];
    return true;
  }
  bool Value(std::string* value) {
    if (index_ >= argc_) return false;
    *value = argv_[index_++];
    return true;
  }

 private:
  int argc_;
  char** argv_;
  int index_ = 1;
};

bool ParseInt(const std::string& text, int low, int high, int* out);
bool ParseSeconds(const std::string& text, double low, double high, double* out);
bool ParsePort(const std::string& text, std::uint16_t* out);

// "A", "A+N" (N consecutive addresses from A) and comma lists of both; every address must lie
// in 127.0.0.0/8 and the whole list holds at most 1,000,000 addresses.
bool ParseTargets(const std::string& text, std::uint16_t port, std::vector<sockaddr_in>* out);

bool PinToCpu(int cpu);

}  // namespace tessel::bench
