#include "support/memory_host.h"

namespace tessel {

Oid MemoryHost::ToOid(const std::string& oidText) {
  std::string text = oidText;
  if (text.empty() || text[0] != '.') text.insert(text.begin(), '.');
  Oid oid;
  if (ParseDottedText(&oid, text, false) <= 0) oid.clear();
  return oid;
}

Oid MemoryHost::KeyOf(const HostValueQuery& query) {
  return ToOid(query.objectOid + "." + query.subId + query.instance.value_or(""));
}

void MemoryHost::SetValue(const std::string& oidText, std::optional<std::string> valueText) {
  std::lock_guard<std::mutex> lock(mutex_);
  objects_[ToOid(oidText)] = Entry{std::move(valueText), "-1", std::nullopt};
}

void MemoryHost::SetError(const std::string& oidText, const std::string& errorText) {
  std::lock_guard<std::mutex> lock(mutex_);
  Entry& entry = objects_[ToOid(oidText)];
  if (!entry.value) entry.value = "x";
  entry.error = errorText;
}

void MemoryHost::RefuseWrite(const std::string& oidText, const std::string& valueText) {
  std::lock_guard<std::mutex> lock(mutex_);
  objects_[ToOid(oidText)].refused = valueText;
}

std::string MemoryHost::ValueOf(const std::string& oidText) const {
  std::lock_guard<std::mutex> lock(mutex_);
  auto found = objects_.find(ToOid(oidText));
  return found == objects_.end() || !found->second.value ? "" : *found->second.value;
}

std::vector<std::string> MemoryHost::StatusLines() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return statusLines_;
}

std::vector<HostValueQuery> MemoryHost::SetCalls() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return setCalls_;
}

void MemoryHost::PrintStatus(const std::string& text) {
  std::lock_guard<std::mutex> lock(mutex_);
  statusLines_.push_back(text);
}

HostValueQuery MemoryHost::LastRead() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return lastRead_;
}

HostAnswer MemoryHost::Answer(const HostValueQuery& query) {
  std::lock_guard<std::mutex> lock(mutex_);
  if (recordReads_) lastRead_ = query;
  auto found = objects_.find(KeyOf(query));
  if (found == objects_.end()) return std::nullopt;
  return std::vector<std::optional<std::string>>{found->second.value, found->second.error};
}

HostAnswer MemoryHost::Store(const Oid& oid, const HostValueQuery& query) {
  std::lock_guard<std::mutex> lock(mutex_);
  setCalls_.push_back(query);
  Entry& entry = objects_[oid];
  if (entry.error != "-1") return std::vector<std::optional<std::string>>{entry.value, entry.error};
  if (entry.refused == query.valueText) return std::vector<std::optional<std::string>>{"x", "6"};
  entry.value = query.valueText;
  return std::vector<std::optional<std::string>>{query.valueText, std::string("-1")};
}

HostAnswer MemoryHost::ScalarGetOidVal(const HostValueQuery& query) { return Answer(query); }

HostAnswer MemoryHost::ScalarGetNextOidVal(const HostValueQuery& query) { return Answer(query); }

HostAnswer MemoryHost::SetOidVal(const HostValueQuery& query) { return Store(KeyOf(query), query); }

HostAnswer MemoryHost::TableGetOidVal(const HostValueQuery& query) { return Answer(query); }

HostAnswer MemoryHost::TableGetNextOidVal(const HostValueQuery& query) {
  Oid entryOid = ToOid(query.objectOid);
  Oid columnOid = entryOid;
  columnOid.push_back(static_cast<std::uint32_t>(query.column));
  Oid from =
      ToOid(query.objectOid + "." + std::to_string(query.column) + query.instance.value_or(""));
  std::lock_guard<std::mutex> lock(mutex_);
  if (recordReads_) lastRead_ = query;
  auto next = query.instance ? objects_.upper_bound(from) : objects_.lower_bound(from);
  if (next == objects_.end() || next->first.size() <= columnOid.size() ||
      !std::equal(columnOid.begin(), columnOid.end(), next->first.begin())) {
    return std::nullopt;
  }
  std::span<const std::uint32_t> relative(next->first.data() + entryOid.size(),
                                          next->first.size() - entryOid.size());
  return std::vector<std::optional<std::string>>{next->second.value, OidToPlainText(relative),
                                                 next->second.error};
}

HostAnswer MemoryHost::TableSetOidVal(const HostValueQuery& query) {
  return Store(KeyOf(query), query);
}

AgentSession LocalAgent(std::int32_t agentId) {
  auto info = std::make_shared<AgentInfo>();
  info->readCommunities.Append("public");
  info->writeCommunities.Append("private");
  info->databaseName = "db";
  info->tableName = "agent1";
  info->agentId = agentId;
  AgentSession agent;
  agent.agentInfo = std::move(info);
  agent.transport.localAddress = "127.0.0.1";
  agent.transport.configuredPortMinusOne = 160;
  return agent;
}

std::vector<InformReport> MemoryHost::AnsweredInforms() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return answered_;
}

std::vector<InformReport> MemoryHost::DroppedInforms() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return dropped_;
}

void MemoryHost::LogResponseMessage(const InformReport& report) {
  std::lock_guard<std::mutex> lock(mutex_);
  answered_.push_back(report);
}

void MemoryHost::StoreDroppedInformMessage(const InformReport& report) {
  std::lock_guard<std::mutex> lock(mutex_);
  dropped_.push_back(report);
}

void MemoryHost::SetScrambler(Scrambler scrambler) {
  std::lock_guard<std::mutex> lock(mutex_);
  scrambler_ = std::move(scrambler);
}

std::vector<ScrambleQuery> MemoryHost::ScrambleQueries() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return scrambleQueries_;
}

std::optional<ScrambleChanges> MemoryHost::ScramblePDU(const ScrambleQuery& query) {
  std::lock_guard<std::mutex> lock(mutex_);
  scrambleQueries_.push_back(query);
  return scrambler_ ? scrambler_(query) : std::nullopt;
}

namespace {

std::string Tl1CodeOf(const Tl1HostQuery& query) {
  std::string code = query.verb;
  if (query.modifier1) code += "-" + *query.modifier1;
  if (query.modifier2) code += "-" + *query.modifier2;
  return code;
}

}  // namespace

void MemoryHost::SetTl1Reply(const std::string& commandCode, Tl1Reply reply) {
  std::lock_guard<std::mutex> lock(mutex_);
  tl1Replies_[commandCode] = std::move(reply);
}

std::vector<Tl1HostQuery> MemoryHost::Tl1Queries() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return tl1Queries_;
}

std::int32_t MemoryHost::Tl1GetAck(const Tl1HostQuery& query) {
  std::lock_guard<std::mutex> lock(mutex_);
  auto found = tl1Replies_.find(Tl1CodeOf(query));
  return found == tl1Replies_.end() ? 0 : found->second.ack;
}

HostAnswer MemoryHost::Tl1GetResponseBlock(const Tl1HostQuery& query) {
  std::lock_guard<std::mutex> lock(mutex_);
  tl1Queries_.push_back(query);
  auto found = tl1Replies_.find(Tl1CodeOf(query));
  return found == tl1Replies_.end() ? std::nullopt : found->second.response;
}

void MemoryHost::SetCliReply(const std::string& line, std::int32_t mode, HostAnswer reply) {
  std::lock_guard<std::mutex> lock(mutex_);
  cliReplies_[{line, mode}] = std::move(reply);
}

void MemoryHost::SetCliHelp(const std::string& line, std::string help) {
  std::lock_guard<std::mutex> lock(mutex_);
  cliHelp_[line] = std::move(help);
}

void MemoryHost::SetCliCompletion(const std::string& line, std::string completed) {
  std::lock_guard<std::mutex> lock(mutex_);
  cliCompletions_[line] = std::move(completed);
}

std::vector<CliHostQuery> MemoryHost::CliQueries() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return cliQueries_;
}

HostAnswer MemoryHost::CliEnterResponse(const CliHostQuery& query) {
  std::lock_guard<std::mutex> lock(mutex_);
  cliQueries_.push_back(query);
  auto found = cliReplies_.find({query.line, query.mode});
  return found == cliReplies_.end() ? std::nullopt : found->second;
}

std::optional<std::string> MemoryHost::CliQuestionResponse(const CliHostQuery& query) {
  std::lock_guard<std::mutex> lock(mutex_);
  auto found = cliHelp_.find(query.line);
  if (found == cliHelp_.end()) return std::nullopt;
  return found->second;
}

std::optional<std::string> MemoryHost::CliTabResponse(const CliHostQuery& query) {
  std::lock_guard<std::mutex> lock(mutex_);
  auto found = cliCompletions_.find(query.line);
  if (found == cliCompletions_.end()) return std::nullopt;
  return found->second;
}

}  // namespace tessel
