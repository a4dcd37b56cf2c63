package com.kestrelon.simulator.tessel.tl1;

import com.kestrelon.simulator.tessel.data.DataFiles;
import com.kestrelon.simulator.tessel.data.DeviceDataException;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.LinkedHashMap;
import java.util.List;
import java.util.Locale;
import java.util.Map;
import java.util.Optional;
import java.util.regex.Matcher;
import java.util.regex.Pattern;

/**
 * The answers of a TL1 network element, read from a TL1 data file: one block per command code, or
 * per command code and AID, each with an optional acknowledgment, its completion code and its
 * response lines. Immutable once read, so any number of threads may look blocks up.
 *
 * <p>The file, line by line: {@code [CODE]} or {@code [CODE AID]} opens a block; then an optional
 * {@code ack IP|PF|NA|RL|OK|NG}; then the completion line ({@code COMPLD}, {@code PRTL},
 * {@code DELAY}, {@code RTRV} or {@code DENY CODE} with a code of the error table); then the
 * response lines up to the next block: {@code "..."} quoted, {@code /*...*}{@code /} a comment,
 * anything else plain. Lines whose first character is {@code #} and blank lines are skipped.
 */
public final class TL1Data {
  private static final Pattern CODE = Pattern.compile("[A-Za-z][A-Za-z0-9]*(-[A-Za-z][A-Za-z0-9]*){0,2}");
  private static final Pattern ACK = Pattern.compile("ack\\s+(\\S+)\\s*");
  /** The key of a block that serves every AID of its code. */
  private static final String ANY_AID = "";

  /** How the engine sets a response line out; the number is the one the engine takes. */
  public enum LineType {
    QUOTED, PLAIN, COMMENT;

    public int number() {
      return ordinal();
    }
  }

  /** One response line as written, placeholders still in it. */
  public record Line(LineType type, String text) {}

  /**
   * One block of the file.
   *
   * @param aid the AID it is for; null when it serves every AID
   * @param ack the acknowledgment's number (1..6), 0 for none
   * @param completion the completion code's number (1..5)
   * @param deny the error code of a DENY block, else null
   * @param line the line of its header
   */
  public record Block(String code, String aid, int ack, int completion, String deny, List<Line> lines, int line) {
    public Block {
      lines = List.copyOf(lines);
    }
  }

  private final String name;
  /** The blocks by command code (upper case, in file order), then by AID (upper case). */
  private final Map<String, Map<String, Block>> blocks;

  private TL1Data(String name, Map<String, Map<String, Block>> blocks) {
    this.name = name;
    this.blocks = blocks;
  }

  /** Reads a TL1 data file; the faults name it as {@code file} is written. */
  public static TL1Data load(Path file) throws DeviceDataException {
    return parse(file.toString(), DataFiles.read(file));
  }

  /** Reads the text of a TL1 data file; the faults name it {@code name}. */
  public static TL1Data parse(String name, String text) throws DeviceDataException {
    return new Reader(name).read(text);
  }

  /** The name the data was read under. */
  public String name() {
    return name;
  }

  /** The command codes that have a block, in file order. */
  public List<String> codes() {
    return List.copyOf(blocks.keySet());
  }

  /**
   * The block that answers a command: the command code is the full code when it has a block, else
   * its verb and first modifier, else its verb (so a generic RTRV-ALM serves RTRV-ALM-ALL), as the
   * engine finds the command; within that code the block of the AID, else the one for every AID.
   */
  public Optional<Block> find(String verb, String modifier1, String modifier2, String aid) {
    Map<String, Block> byAid = blocks.get(join(verb, modifier1, modifier2));
    if (byAid == null && modifier1 != null && modifier2 != null) {
      byAid = blocks.get(join(verb, modifier1, null));
    }
    if (byAid == null && modifier1 != null) {
      byAid = blocks.get(join(verb, null, null));
    }
    if (byAid == null) {
      return Optional.empty();
    }
    Block own = aid == null ? null : byAid.get(aid.toUpperCase(Locale.ROOT));
    return Optional.ofNullable(own != null ? own : byAid.get(ANY_AID));
  }

  /** A command code from its parts, upper case; absent parts are null. */
  public static String join(String verb, String modifier1, String modifier2) {
    String code = verb;
    if (modifier1 != null) {
      code += "-" + modifier1;
      if (modifier2 != null) {
        code += "-" + modifier2;
      }
    }
    return code.toUpperCase(Locale.ROOT);
  }

  /** Reads one file: a block being filled at a time, faults thrown with their line. */
  private static final class Reader {
    private final String name;
    private final Map<String, Map<String, Block>> blocks = new LinkedHashMap<>();
    private String code;
    private String aid;
    private int headerLine;
    private int ack;
    private int completion;
    private String deny;
    private final List<Line> lines = new ArrayList<>();

    Reader(String name) {
      this.name = name;
    }

    TL1Data read(String text) throws DeviceDataException {
      String[] fileLines = text.split("\n", -1);
      for (int i = 0; i < fileLines.length; i++) {
        String line = fileLines[i].endsWith("\r") ? fileLines[i].substring(0, fileLines[i].length() - 1)
            : fileLines[i];
        if (!line.isBlank() && !line.startsWith("#")) {
          take(line, i + 1);
        }
      }
      close();
      return new TL1Data(name, blocks);
    }

    private void take(String line, int number) throws DeviceDataException {
      if (line.startsWith("[")) {
        close();
        open(line, number);
      } else if (code == null) {
        throw fault(number, "a response line outside a block (a block starts with [CODE] or [CODE AID])");
      } else if (completion != 0) {
        lines.add(responseLine(line));
      } else if (ack == 0 && ACK.matcher(line.strip()).matches()) {
        ack = ack(line.strip(), number);
      } else {
        completion(line.strip(), number);
      }
    }

    private void open(String header, int number) throws DeviceDataException {
      if (!header.strip().endsWith("]")) {
        throw fault(number, "the block header " + header.strip() + " is not closed with ']'");
      }
      String[] words = header.strip().substring(1, header.strip().length() - 1).strip().split("\\s+");
      if (words.length > 2 || words[0].isEmpty()) {
        throw fault(number, "a block header takes [CODE] or [CODE AID], not " + header.strip());
      }
      if (!CODE.matcher(words[0]).matches()) {
        throw fault(number, "'" + words[0] + "' is not a command code (VERB[-MOD1[-MOD2]])");
      }
      code = words[0].toUpperCase(Locale.ROOT);
      aid = words.length == 2 ? words[1] : null;
      Block earlier = blocks.getOrDefault(code, Map.of()).get(aidKey(aid));
      if (earlier != null) {
        throw fault(number, "a second block " + header.strip() + " (the first is on line " + earlier.line() + ")");
      }
      headerLine = number;
      ack = 0;
      completion = 0;
      deny = null;
      lines.clear();
    }

    private void close() throws DeviceDataException {
      if (code == null) {
        return;
      }
      if (completion == 0) {
        throw fault(headerLine, "the block [" + code + (aid == null ? "" : " " + aid)
            + "] has no completion line (COMPLD, PRTL, DELAY, RTRV or DENY CODE)");
      }
      blocks.computeIfAbsent(code, c -> new LinkedHashMap<>())
          .put(aidKey(aid), new Block(code, aid, ack, completion, deny, lines, headerLine));
      code = null;
    }

    private int ack(String line, int number) throws DeviceDataException {
      Matcher matcher = ACK.matcher(line);
      matcher.matches();
      int found = TL1Codes.ackNumber(matcher.group(1).toUpperCase(Locale.ROOT));
      if (found == 0) {
        throw fault(number, "unknown ack code '" + matcher.group(1) + "' (" + String.join(", ", TL1Codes.ACKS) + ")");
      }
      return found;
    }

    private void completion(String line, int number) throws DeviceDataException {
      String[] words = line.split("\\s+");
      String word = words[0].toUpperCase(Locale.ROOT);
      if (word.equals("DENY")) {
        String error = words.length == 2 ? words[1].toUpperCase(Locale.ROOT) : "";
        if (words.length != 2 || TL1Codes.errorNumber(error) == 0) {
          throw fault(number, "DENY takes one code of the error table (such as IENE), not '" + line + "'");
        }
        deny = error;
      }
      completion = words.length == 1 || word.equals("DENY") ? TL1Codes.completionNumber(word) : 0;
      if (completion == 0) {
        throw fault(number, "unknown completion code '" + line + "' (COMPLD, PRTL, DELAY, RTRV or DENY CODE)");
      }
    }

    private static Line responseLine(String line) {
      if (line.length() >= 2 && line.startsWith("\"") && line.endsWith("\"")) {
        return new Line(LineType.QUOTED, line.substring(1, line.length() - 1));
      }
      if (line.length() >= 4 && line.startsWith("/*") && line.endsWith("*/")) {
        return new Line(LineType.COMMENT, line.substring(2, line.length() - 2));
      }
      return new Line(LineType.PLAIN, line);
    }

    private static String aidKey(String aid) {
      return aid == null ? ANY_AID : aid.toUpperCase(Locale.ROOT);
    }

    private DeviceDataException fault(int line, String reason) {
      return new DeviceDataException(name, line, reason);
    }
  }
}
