// An in-memory host for tests, fuzzers and benchmarks: values are kept in one map keyed by the
// object's full OID and served with the same contract as the Java host (scalar Get and GetNext
// of the named object, table GetNext of the next instance of the same column). Thread-safe.
#pragma once

#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "base/conversions.h"
#include "engine/agent.h"
#include "engine/host_bridge.h"

namespace tessel {

class MemoryHost : public HostBridge {
 public:
  // oidText is dotted, with or without a leading dot; a value of nullopt is answered as null.
  void SetValue(const std::string& oidText, std::optional<std::string> valueText);
  // The object answers [value, errorText] (its value, or "x" when it has none).
  void SetError(const std::string& oidText, const std::string& errorText);
  // A write of exactly valueText to the object is refused with genErr; other writes succeed.
  void RefuseWrite(const std::string& oidText, const std::string& valueText);
  std::string ValueOf(const std::string& oidText) const;
  std::vector<std::string> StatusLines() const;
  std::vector<HostValueQuery> SetCalls() const;
  // Keeps the query of every Get and GetNext for LastRead (off by default: the micro-benchmarks
  // serve from this host and should not pay for the copy).
  void RecordReads() { recordReads_ = true; }
  HostValueQuery LastRead() const;  // the query of the last Get or GetNext
  // The informs the engine reported answered and dropped, in order.
  std::vector<InformReport> AnsweredInforms() const;
  std::vector<InformReport> DroppedInforms() const;

  // What ScramblePDU answers; the queries it was given are kept in order.
  using Scrambler = std::function<std::optional<ScrambleChanges>(const ScrambleQuery&)>;
  void SetScrambler(Scrambler scrambler);
  std::vector<ScrambleQuery> ScrambleQueries() const;

  // What a TL1 command answers, by its code as the engine passes it (VERB, VERB-MOD1 or
  // VERB-MOD1-MOD2); a code without a reply acknowledges nothing and answers null. The queries
  // of the response-block calls are kept in order.
  struct Tl1Reply {
    std::int32_t ack = 0;
    HostAnswer response;
  };
  void SetTl1Reply(const std::string& commandCode, Tl1Reply reply);
  std::vector<Tl1HostQuery> Tl1Queries() const;

  // What a CLI line answers, by the line as the engine passes it and the session's mode; a line
  // without a reply answers null. Help and completion answer by the line alone. The queries of
  // the line calls are kept in order.
  void SetCliReply(const std::string& line, std::int32_t mode, HostAnswer reply);
  void SetCliHelp(const std::string& line, std::string help);
  void SetCliCompletion(const std::string& line, std::string completed);
  std::vector<CliHostQuery> CliQueries() const;

  void PrintStatus(const std::string& text) override;
  HostAnswer ScalarGetOidVal(const HostValueQuery& query) override;
  HostAnswer ScalarGetNextOidVal(const HostValueQuery& query) override;
  HostAnswer SetOidVal(const HostValueQuery& query) override;
  HostAnswer TableGetOidVal(const HostValueQuery& query) override;
  HostAnswer TableGetNextOidVal(const HostValueQuery& query) override;
  HostAnswer TableSetOidVal(const HostValueQuery& query) override;
  void LogResponseMessage(const InformReport& report) override;
  void StoreDroppedInformMessage(const InformReport& report) override;
  std::optional<ScrambleChanges> ScramblePDU(const ScrambleQuery& query) override;
  std::int32_t Tl1GetAck(const Tl1HostQuery& query) override;
  HostAnswer Tl1GetResponseBlock(const Tl1HostQuery& query) override;
  HostAnswer CliEnterResponse(const CliHostQuery& query) override;
  std::optional<std::string> CliQuestionResponse(const CliHostQuery& query) override;
  std::optional<std::string> CliTabResponse(const CliHostQuery& query) override;

 private:
  struct Entry {
    std::optional<std::string> value;
    std::string error = "-1";
    std::optional<std::string> refused;
  };
  static Oid ToOid(const std::string& oidText);
  // The object a scalar or exact table call names: object OID, sub-identifier, instance.
  static Oid KeyOf(const HostValueQuery& query);
  HostAnswer Answer(const HostValueQuery& query);
  HostAnswer Store(const Oid& oid, const HostValueQuery& query);

  mutable std::mutex mutex_;
  std::map<Oid, Entry> objects_;
  std::vector<std::string> statusLines_;
  std::vector<HostValueQuery> setCalls_;
  HostValueQuery lastRead_;
  std::vector<InformReport> answered_;
  std::vector<InformReport> dropped_;
  bool recordReads_ = false;
  Scrambler scrambler_;
  std::vector<ScrambleQuery> scrambleQueries_;
  std::map<std::string, Tl1Reply> tl1Replies_;
  std::vector<Tl1HostQuery> tl1Queries_;
  std::map<std::pair<std::string, std::int32_t>, HostAnswer> cliReplies_;
  std::map<std::string, std::string> cliHelp_;
  std::map<std::string, std::string> cliCompletions_;
  std::vector<CliHostQuery> cliQueries_;
};

// The session of an agent on 127.0.0.1, port 161 (stored as 160), with the read community
// "public", the write community "private", database "db" and table "agent1".
AgentSession LocalAgent(std::int32_t agentId);

}  // namespace tessel
