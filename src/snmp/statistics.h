// The SNMP statistics counters reported to the host, and the ring of the last 100 requests
// answered with an error. Updated from every request thread; reads are snapshots.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace tessel {

enum class SnmpCounter : int {
  kInMessages = 0,
  kOutMessages = 1,
  kInGetRequests = 2,
  kInGetNexts = 3,
  kInSetRequests = 4,
  kInGetBulks = 5,
  kV1GetRequests = 6,
  kV1GetNexts = 7,
  kV1SetRequests = 8,
  kV2GetRequests = 9,
  kV2GetNexts = 10,
  kV2GetBulks = 11,
  kV2SetRequests = 12,
  kV3GetRequests = 13,
  kV3GetNexts = 14,
  kV3GetBulks = 15,
  kV3SetRequests = 16,
  kV1Requests = 17,
  kV2Requests = 18,
  kV3Requests = 19,
  kOutTraps = 20,
  kDroppedRequests = 21,
  kAsnParseErrors = 22,
  kBadVersions = 23,
  kBadCommunityNames = 24,
  kV3SecurityErrors = 25,
  kOutResponses = 26,
  kInTraps = 27,
  // Kept but not reported.
  kGetVarsAnswered,
  kSetVarsAnswered,
  kInTooBigs,
  kBadCommunityUses,
  kOutTooBigs,
  kOutNoSuchNames,
  kOutBadValues,
  kOutGenErrs,
  kCount
};

inline constexpr int kReportedCounters = 28;

void CountSnmp(SnmpCounter counter, std::uint32_t amount = 1);
std::uint32_t SnmpCount(SnmpCounter counter);
// The 28 reported counters in report order.
std::vector<std::int32_t> GetReportOverviewDetails();
void ResetSnmpStatistics();

// Records one request answered with a non-zero error status.
void RecordErrorLog(std::int32_t requestId, std::uint8_t pduType, std::int32_t version,
                    std::int32_t errorStatus, const std::string& managerAddress);
// Oldest first, four integers each (request-id, version, PDU type, error status), then the
// count; an empty ring gives {0}. Also keeps the entries' manager addresses for GetIpAddrArr.
std::vector<std::int32_t> GetErrorLogs();
// The first n manager addresses kept by the last GetErrorLogs call.
std::vector<std::string> GetIpAddrArr(int n);

}  // namespace tessel
