#include "tl1/response_format.h"

#include <array>
#include <cstdio>

namespace tessel {
namespace {

constexpr std::array<Tl1ErrorEntry, kTl1ErrorCount> kErrorTable{{
    {"EANS", "ACCESS NOT SUPPORTED"},
    {"EATN", "NOT VALID FOR ACCESS TYPE"},
    {"EFON", "FEATURE OPTION NOT PROVIDED"},
    {"EN2T", "NOT 2-WIRE TERMINATE AND LEAVE"},
    {"ENAC", "NOT EQUIPPED WITH ALARM CUTOFF"},
    {"ENAD", "NOT EQUIPPED WITH AUDIT CAPABILITY"},
    {"ENAR", "NOT EQUIPPED WITH AUTOMATIC RECONFIGURATION"},
    {"ENAT", "REQUEST NOT VALID FOR ACCESS TYPE"},
    {"ENDG", "NOT EQUIPPED WITH DIAGNOSTIC CAPABILITY"},
    {"ENDS", "NOT EQUIPPED WITH DUPLEX SWITCHING"},
    {"ENEA", "NOT EQUIPPED WITH ERROR ANALYSIS CAPABILITY"},
    {"ENEQ", "NOT EQUIPPED"},
    {"ENEX", "NOT EQUIPPED WITH EXERCISE CAPABILITY"},
    {"ENFE", "FEATURE NOT PROVIDED"},
    {"ENFL", "NOT EQUIPPED FOR FAULT LOCATING"},
    {"ENHN", "NOT HYBRID NETWORK"},
    {"ENMB", "NOT MULTIPOINT BRIDGE"},
    {"ENMD", "NOT EQUIPPED WITH MEMORY DEVICE"},
    {"ENPM", "NOT EQUIPPED FOR PERFORMANCE MONITORING"},
    {"ENPS", "NOT EQUIPPED WITH PROTECTION SWITCHING"},
    {"ENRE", "NOT RECOGNIZED EQUIPAGE"},
    {"ENRI", "NOT EQUIPPED FOR RETRIEVING SPECIFIED INFORMATION"},
    {"ENRS", "NOT EQUIPPED FOR RESTORATION"},
    {"ENSA", "NOT EQUIPPED FOR SCHEDULING AUDIT"},
    {"ENSG", "NOT SOFTWARE GENERIC"},
    {"ENSI", "NOT EQUIPPED FOR SETTING SPECIFIED INFORMATION"},
    {"ENSS", "NOT EQUIPPED WITH SYNCHRONIZATION SWITCHING"},
    {"ENTL", "NOT TERMINATE AND LEAVE"},
    {"ERLC", "RED-LINED CIRCUIT"},
    {"ERNS", "RTU DOES NOT SUPPORT COMMAND"},
    {"ESPG", "SOFTWARE PROGRAM"},
    {"ETNS", "TSC DOES NOT SUPPORT COMMAND"},
    {"FNCR", "NE FAIL-CIRCUIT RESTORED TO LAST COND-MON-TERM"},
    {"FNDT", "NO DIAL TONE DETECTED"},
    {"FNEC", "NTE HAS LOST 8-KHZ BYTE CLOCK"},
    {"FNSC", "NTE HAS LOST 64-KHZ BIT CLOCK"},
    {"FRCE", "RTU COMPONENT OR CONFIGURATION ERROR"},
    {"FRDA", "RTU DOES NOT ANSWER THE CALL"},
    {"FREC", "RTU EIGHT KHZ BYTE CLOCK LOST"},
    {"FRNR", "RTU DOES NOT REPLY"},
    {"IBEX", "BLOCK, EXTRA"},
    {"IBMS", "BLOCK, MISSING"},
    {"IBNC", "BLOCK, NOT CONSISTENT"},
    {"ICNV", "COMMAND NOT VALID"},
    {"IDMS", "DATA MISSING"},
    {"IDNC", "DATA NOT CONSISTENT"},
    {"IDNV", "DATA NOT VALID"},
    {"IDRG", "DATA RANGE ERROR"},
    {"IEAE", "ENTITY TO BE CREATED ALREADY EXISTS"},
    {"IENE", "SPECIFIED OBJECT ENTITY DOES NOT EXIST"},
    {"IIAC", "INVALID ACCESS IDENTIFIER"},
    {"IICM", "INVALID COMMAND"},
    {"IICT", "INVALID CORRELATION TAG"},
    {"IIDT", "INVALID DATA PARAMETER"},
    {"IIFM", "INVALID DATA FORMAT"},
    {"IIPG", "INVALID PARAMETER GROUPING"},
    {"IISP", "INVALID SYNTAX OR PUNCTUATION"},
    {"IITA", "INVALID TARGET IDENTIFIER"},
    {"INAC", "ACCESS NUMBER NOT CORRECT"},
    {"INUP", "NON-NULL UNIMPLEMENTED PARAMETER"},
    {"IPEX", "PARAMETER EXTRA"},
    {"IPMS", "PARAMETER, MISSING"},
    {"IPNC", "PARAMETER NOT CONSISTENT"},
    {"IPNV", "PARAMETER NOT VALID"},
    {"ISCH", "SYNTAX INVALID CHARACTER"},
    {"ISPC", "SYNTAX PUNCTUATION"},
    {"ITSN", "INVALID or INACTIVE TEST SESSION NUMBER"},
    {"PICC", "ILLEGAL COMMAND CODE"},
    {"PIMA", "INVALID MEMORY ADDRESS"},
    {"PIMF", "INVALID MEMORY FILE"},
    {"PIUC", "STATED USER PRIVILEGE CODE IS ILLEGAL"},
    {"PLNA", "LOGIN NOT ACTIVE"},
    {"RABY", "ALL TAPS BUSY"},
    {"RALB", "ALL UNITS OF REQUESTED TYPE ARE BUSY"},
    {"RANB", "ACCESS NETWORK BUSY"},
    {"RCBY", "CIRCUIT BUSY"},
    {"RCIN", "REQUESTED CIRCUIT ID DOES NOT EXIST"},
    {"RNAN", "REQUESTED NE ACCESS NUMBER DOES NOT EXIST"},
    {"RNAU", "REQUESTED NE ACCESS NUMBER UNASSIGNED"},
    {"RNBY", "NE IS BUSY"},
    {"RRCB", "UNIT SPECIFIED BY ROUTING CODE BUSY"},
    {"RRNG", "CHANGE EXCEEDS RANGE"},
    {"RTBY", "TAP BUSY"},
    {"RTEN", "TAP DOES NOT EXIST"},
    {"RTUB", "TEST UNIT BUSY"},
    {"SAAL", "ALREADY ALLOWED"},
    {"SAAS", "ALREADY ASSIGNED"},
    {"SABT", "ABORTED"},
    {"SACS", "ACCESS UNIT CAN NOT SYNC ON FACILITY SIGNAL"},
    {"SADC", "ALREADY DISCONNECTED"},
    {"SADS", "ACCESS UNIT IN DIAGNOSTIC STATE"},
    {"SAIN", "ALREADY INHIBITED"},
    {"SAIS", "ALREADY IN-SERVICE"},
    {"SAMS", "ALREADY IN MAINTENANCE STATE"},
    {"SAOP", "ALREADY OPERATED"},
    {"SAOS", "ALREADY OUT-OF-SERVICE"},
    {"SAPF", "ACCESS PATH CONTINUITY CHECK FAILED"},
    {"SAPR", "ALREADY IN PROTECTION STATE"},
    {"SARB", "ALL RESOURCES BUSY"},
    {"SATF", "AUTOMATIC TEST FAILED"},
    {"SCAT", "CIRCUIT IS ALREADY CONNECTED TO ANOTHER TAP"},
    {"SCBS", "CHANNEL BUSY"},
    {"SCIS", "CIRCUIT IN SPLIT CONDITION"},
    {"SCNA", "COMMAND NOT ABLE TO BE ABORTED"},
    {"SCNF", "COMMAND NOT FOUND"},
    {"SCNS", "CIRCUIT NOT IN SPLIT CONDITION"},
    {"SCOS", "CHANNEL OUT-OF-SERVICE"},
    {"SCSD", "CAN NOT SPLIT DS0B CIRCUIT"},
    {"SCSN", "INVALID COMMAND SEQUENCE"},
    {"SDAS", "DIAGNOSIS ALREADY STARTED"},
    {"SDBE", "INTERNAL DATA BASE ERROR"},
    {"SDFA", "DUPLEX UNIT FAILED"},
    {"SDLD", "DUPLEX UNIT LOCKED"},
    {"SDNA", "DUPLEX UNIT NOT AVAILABLE"},
    {"SDNC", "INPUT DATA IS NOT CONSISTENT WITH NE DATA"},
    {"SDNR", "DATA NOT READY"},
    {"SDNS", "DIAGNOSIS NOT STARTED YET"},
    {"SEOS", "NTE IS OUT-OF-SERVICE"},
    {"SFAS", "FAULT LOCATING ALREADY STARTED"},
    {"SFNS", "FAULT LOCATING NOT STARTED YET"},
    {"SFYA", "FACILITY REPORTS YELLOW ALARM"},
    {"SLNS", "LOG NOT STARTED YET"},
    {"SLOS", "TSC TO RTU LINK OUT OF SERVICE"},
    {"SNCC", "NOT CROSS-CONNECTED"},
    {"SNCN", "NTE UNABLE TO EXECUTE COMMAND"},
    {"SNDS", "NTE IS IN A DIAGNOSTIC STATE"},
    {"SNIM", "NTE ACCESS COMPLETE, CIRCUIT WAS INMONITOR STATE"},
    {"SNIS", "NOT IN SERVICE"},
    {"SNML", "NO MONITOR LINE ESTABLISHED"},
    {"SNNB", "NTE COULD NOT SYNC ON DS0B SIGNAL"},
    {"SNNS", "NTE COULD NOT SYNC ON DS1 SIGNAL"},
    {"SNOS", "NTE IS OUT-OF-SERVICE"},
    {"SNPR", "NOT IN PROTECTION STATE"},
    {"SNRM", "SYSTEM NOT IN RESTORATION MODE"},
    {"SNRS", "NOT RESERVED"},
    {"SNSR", "NO SWITCH REQUEST OUTSTANDING"},
    {"SNVS", "NOT IN VALID STATE"},
    {"SNYA", "NTE HAS DETECTED A YELLOW ALARM"},
    {"SOSE", "OPERATING SYSTEM ERROR"},
    {"SOST", "OUT-OF-SERVICE, TESTING"},
    {"SPFA", "PROTECTION UNIT FAILED"},
    {"SPLD", "PROTECTION UNIT LOCKED"},
    {"SPNA", "PROCESS NOT ABLE TO BE ABORTED"},
    {"SPNF", "PROCESS NOT FOUND"},
    {"SRAC", "REQUESTED ACCESS CONFIGURATION IS INVALID"},
    {"SRAN", "UNABLE TO RELEASE ACCESS SYSTEM"},
    {"SRCI", "REQUESTED COMMANDS INHIBITED"},
    {"SRCN", "REQUESTED CONDITION ALREADY EXISTS"},
    {"SROF", "REQUESTED OPERATION FAILED"},
    {"SROS", "REQUIRED RTU OUT OF SERVICE"},
    {"SRQN", "INVALID REQUEST"},
    {"SRTN", "UNABLE TO RELEASE TAP"},
    {"SRTO", "REPLY TIMEOUT OCCURRED"},
    {"SSCE", "SYSTEMIC SNIDER COMMUNICATIONS ERROR"},
    {"SSNG", "SUBRATE SELECTED IS INCORRECT"},
    {"SSNP", "TEST SIGNAL NOT PSEUDO-RANDOM"},
    {"SSNQ", "TEST SIGNAL NOT QRS"},
    {"SSPN", "SPEED SELECTED IS INCORRECT"},
    {"SSRD", "SWITCH REQUEST DENIED"},
    {"SSRE", "SYSTEM RESOURCES EXCEEDED"},
    {"SSTP", "EXECUTION STOPPED DUE TO HARDWARE OR SOFTWARE PROBLEM"},
    {"STAB", "TEST ABORTED"},
    {"STLC", "TAP UNABLE TO LOCATE CHANNEL"},
    {"STNO", "TSC/RTU TO TAU LINK OUT OF SERVICE"},
    {"STOS", "TEST ACCESS UNIT OUT OF SERVICE"},
    {"STTI", "TAP IDLE"},
    {"SWFA", "WORKING UNIT FAILED"},
    {"SWLD", "WORKING UNIT LOCKED"},
    {"ANSO", "NO SUCH OBJECT"},
    {"ARAE", "ROW ALREADY EXIST"},
    {"AIEI", "INVALID EXTERNAL INDEX"},
    {"ARDO", "READ ONLY"},
    {"ANRS", "NO ROW STATUS COLUMN"},
    {"AIIM", "INDEX IS INVALID OR MISSING"},
    {"PIUI", "PRIVILEGE, ILLEGAL USER IDENTITY"},
    {"AIDT", "INVALID DATE TIME"},
}};

constexpr std::array<const char*, 6> kAckWords{"IP", "PF", "NA", "RL", "OK", "NG"};
constexpr std::array<const char*, 5> kCompletionWords{"COMPLD", "DENY", "PRTL", "DELAY", "RTRV"};
constexpr std::array<const char*, 4> kAlarmCodeTexts{"*C", "**", "* ", "A "};

void AppendLine(std::string* text, std::uint8_t type, std::string_view line) {
  text->append("\r\n   ");
  if (type == kTl1QuotedLine || type == 4) {
    text->append("\"").append(line).append("\"");
  } else if (type == kTl1CommentLine || type == 6) {
    text->append("/*").append(line).append("*/");
  } else {
    text->append(line);
  }
}

// Room a line of this type needs beyond its text: its indent and marks, and the terminator.
std::size_t LineReserve(std::uint8_t type) { return 2u * type + 6u; }

// At most limit bytes of text, not ending inside a UTF-8 sequence when that can be helped.
std::size_t CutPoint(std::string_view text, std::size_t limit) {
  if (limit >= text.size()) return text.size();
  std::size_t cut = limit;
  while (cut > 0 && (static_cast<unsigned char>(text[cut]) & 0xC0) == 0x80) --cut;
  return cut > 0 ? cut : limit;
}

}  // namespace

const Tl1ErrorEntry* Tl1Error(int errorNumber) {
  if (errorNumber < 1 || errorNumber > kTl1ErrorCount) return nullptr;
  return &kErrorTable[static_cast<std::size_t>(errorNumber - 1)];
}

int Tl1ErrorNumber(std::string_view code) {
  for (std::size_t i = 0; i < kErrorTable.size(); ++i) {
    if (code == kErrorTable[i].code) return static_cast<int>(i + 1);
  }
  return 0;
}

const char* AckCodeWord(int ackCode) {
  return ackCode >= 1 && ackCode <= 6 ? kAckWords[static_cast<std::size_t>(ackCode - 1)] : nullptr;
}

const char* CompletionCodeWord(int completionCode) {
  if (completionCode < 1 || completionCode > 5) return nullptr;
  return kCompletionWords[static_cast<std::size_t>(completionCode - 1)];
}

std::tm SystemLocalTime() {
  std::time_t now = std::time(nullptr);
  std::tm local{};
  localtime_r(&now, &local);
  return local;
}

std::string FormatHeader(std::string_view sid, const std::tm& now) {
  char stamp[40];
  std::snprintf(stamp, sizeof stamp, " %02d-%02d-%02d %02d:%02d:%02d", now.tm_year % 100,
                now.tm_mon + 1, now.tm_mday, now.tm_hour, now.tm_min, now.tm_sec);
  std::string header = "\r\n\n   ";
  header.append(sid).append(stamp);
  return header;
}

std::string FormatResponseIdentification(const std::optional<std::string>& ctag,
                                         int completionCode) {
  const char* word = CompletionCodeWord(completionCode);
  return "\r\nM  " + ctag.value_or("0") + " " + (word ? word : "DENY");
}

std::string FormatAutonomousIdentification(std::uint8_t alarmCode, std::uint32_t atag,
                                           std::string_view verb,
                                           const std::optional<std::string>& modifier1,
                                           const std::optional<std::string>& modifier2) {
  std::string identification = "\r\n";
  identification.append(kAlarmCodeTexts[alarmCode < 4 ? alarmCode : 3]);
  identification.append(" ").append(std::to_string(atag)).append(" ").append(verb);
  if (modifier1) identification.append(" ").append(*modifier1);
  if (modifier2) identification.append(" ").append(*modifier2);
  return identification;
}

std::vector<std::string> FormatTextBlocks(const std::string& opening,
                                          const std::vector<Tl1TextElement>& elements) {
  std::vector<std::string> texts;
  std::size_t index = 0;   // the element the next text starts with
  std::size_t offset = 0;  // and where in its text, after a cut
  do {
    std::string text = opening;
    bool hasLines = false;
    while (index < elements.size()) {
      const Tl1TextElement& element = elements[index];
      std::string_view rest = std::string_view(element.text).substr(offset);
      std::size_t needed = text.size() + rest.size() + LineReserve(element.type);
      if (needed <= kTl1ResponseSize) {
        AppendLine(&text, element.type, rest);
        hasLines = true;
        ++index;
        offset = 0;
        continue;
      }
      if (hasLines) break;
      // A line too long for a response of its own: as much as fits here, the rest in the next.
      std::size_t room = kTl1ResponseSize - std::min(kTl1ResponseSize, needed - rest.size());
      std::size_t cut = CutPoint(rest, std::max<std::size_t>(room, 1));
      AppendLine(&text, element.type, rest.substr(0, cut));
      offset += cut;
      break;
    }
    text.append(index < elements.size() ? "\r\n>" : "\r\n;");
    texts.push_back(std::move(text));
  } while (index < elements.size());
  return texts;
}

std::vector<std::string> OutputFormattor(std::string_view sid, const std::tm& now,
                                         const std::optional<std::string>& ctag, int completionCode,
                                         const std::vector<Tl1TextElement>& elements) {
  return FormatTextBlocks(
      FormatHeader(sid, now) + FormatResponseIdentification(ctag, completionCode), elements);
}

std::vector<std::string> FormatAutonomousMessage(std::string_view sid, const std::tm& now,
                                                 std::uint8_t alarmCode, std::uint32_t atag,
                                                 std::string_view verb,
                                                 const std::optional<std::string>& modifier1,
                                                 const std::optional<std::string>& modifier2,
                                                 const std::vector<Tl1TextElement>& elements) {
  return FormatTextBlocks(FormatHeader(sid, now) + FormatAutonomousIdentification(
                                                       alarmCode, atag, verb, modifier1, modifier2),
                          elements);
}

std::string AckFormatter(int ackCode, std::string_view ctag) {
  const char* word = AckCodeWord(ackCode);
  std::string text = word ? word : "NA";
  text.append(" ").append(ctag).append("\r\n<");
  return text;
}

void OutputErrorFormatter(std::vector<Tl1TextElement>* elements, int errorNumber) {
  const Tl1ErrorEntry* entry = Tl1Error(errorNumber);
  if (!entry) return;
  elements->push_back({kTl1PlainLine, entry->code});
  elements->push_back({kTl1QuotedLine, entry->text});
}

}  // namespace tessel
