// A log-linear latency histogram in nanoseconds: exact below 128 ns, then 64 buckets per power
// of two (about 1.6 % resolution) up to 2^63. Recording is a few instructions and never
// allocates. Not thread-safe; one per generator thread.
#pragma once

#include <algorithm>
#include <array>
#include <bit>
#include <cmath>
#include <cstdint>

namespace tessel::bench {

class Histogram {
 public:
  void Record(std::uint64_t value) {
    ++counts_[Index(value)];
    ++total_;
    maximum_ = std::max(maximum_, value);
  }

  std::uint64_t Count() const { return total_; }
  std::uint64_t Maximum() const { return maximum_; }

  // The midpoint of the bucket holding the q-quantile (0 < q <= 1); 0 when empty.
  std::uint64_t Percentile(double q) const {
    if (total_ == 0) return 0;
    const auto rank = static_cast<std::uint64_t>(std::ceil(q * static_cast<double>(total_)));
    std::uint64_t seen = 0;
    for (std::size_t i = 0; i < counts_.size(); ++i) {
      seen += counts_[i];
      if (seen >= std::max<std::uint64_t>(rank, 1)) return std::min(Midpoint(i), maximum_);
    }
    return maximum_;
  }

 private:
  static constexpr int kSubBits = 7;
  static constexpr std::uint64_t kLinear = 1u << kSubBits;  // 128
  static constexpr std::uint64_t kHalf = kLinear / 2;       // sub-buckets per power of two
  static constexpr std::size_t kBuckets = kLinear + (64 - kSubBits) * kHalf;

  static std::size_t Index(std::uint64_t value) {
    if (value < kLinear) return static_cast<std::size_t>(value);
    const int top = std::bit_width(value) - 1;  // >= kSubBits
    const int shift = top - (kSubBits - 1);
    const std::uint64_t sub = (value >> shift) - kHalf;  // [0, 64)
    return static_cast<std::size_t>(kLinear + static_cast<std::uint64_t>(top - kSubBits) * kHalf +
                                    sub);
  }

  static std::uint64_t Midpoint(std::size_t index) {
    if (index < kLinear) return index;
    const std::uint64_t offset = index - kLinear;
    const int shift = static_cast<int>(offset / kHalf) + 1;
    const std::uint64_t low = (kHalf + offset % kHalf) << shift;
    return low + (std::uint64_t{1} << shift) / 2;
  }

  std::array<std::uint64_t, kBuckets> counts_{};
  std::uint64_t total_ = 0;
  std::uint64_t maximum_ = 0;
};

}  // namespace tessel::bench
