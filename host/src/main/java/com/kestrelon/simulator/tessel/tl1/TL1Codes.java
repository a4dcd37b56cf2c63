package com.kestrelon.simulator.tessel.tl1;

import java.util.HashMap;
import java.util.List;
import java.util.Map;

/**
 * The words of TL1 answers: the 176 error codes with their texts (numbered from 1, the numbers the
 * engine uses), the acknowledgment codes and the completion codes, each with the number the engine
 * takes from the host. Immutable.
 */
public final class TL1Codes {
  /** Acknowledgment codes, numbered from 1. */
  public static final List<String> ACKS = List.of("IP", "PF", "NA", "RL", "OK", "NG");
  /** Completion codes, numbered from 1. */
  public static final List<String> COMPLETIONS = List.of("COMPLD", "DENY", "PRTL", "DELAY", "RTRV");
  public static final int DENY = 2;

  private static final String[][] ERRORS = {
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
      {"AIDT", "INVALID DATE TIME"}
  };
  private static final Map<String, Integer> NUMBERS = new HashMap<>();

  static {
    for (int i = 0; i < ERRORS.length; i++) {
      NUMBERS.put(ERRORS[i][0], i + 1);
    }
  }

  private TL1Codes() {}

  /** How many error codes there are; they are numbered 1 to this. */
  public static int errorCount() {
    return ERRORS.length;
  }

  /** The number of an error code (1..176), 0 when it is not one. */
  public static int errorNumber(String code) {
    return NUMBERS.getOrDefault(code, 0);
  }

  /** The four-letter code of error {@code number} (1..176). */
  public static String errorCode(int number) {
    return ERRORS[number - 1][0];
  }

  /** The text of error {@code number} (1..176). */
  public static String errorText(int number) {
    return ERRORS[number - 1][1];
  }

  /** The number of an acknowledgment code (1..6), 0 when it is not one. */
  public static int ackNumber(String word) {
    return ACKS.indexOf(word) + 1;
  }

  /** The number of a completion code (1..5), 0 when it is not one. */
  public static int completionNumber(String word) {
    return COMPLETIONS.indexOf(word) + 1;
  }
}
