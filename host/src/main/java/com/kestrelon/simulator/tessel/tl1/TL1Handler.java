package com.kestrelon.simulator.tessel.tl1;

import com.kestrelon.simulator.tessel.NativeLibrary;
import com.kestrelon.simulator.tessel.tl1.TL1Data.Block;
import com.kestrelon.simulator.tessel.tl1.TL1Data.Line;
import java.time.Clock;
import java.time.LocalDateTime;
import java.time.format.DateTimeFormatter;
import java.util.ArrayList;
import java.util.HashMap;
import java.util.LinkedHashSet;
import java.util.List;
import java.util.Map;
import java.util.Optional;
import java.util.Set;
import java.util.concurrent.ConcurrentHashMap;
import java.util.function.Supplier;
import java.util.regex.Matcher;
import java.util.regex.Pattern;

/**
 * The TL1 side of the host: the engine asks it, from several of its threads at once, for the
 * acknowledgment and the response of each command a device receives. Each device (agent id) is
 * registered with its name, which answers as its SID, its group, the group's TL1 data and the users
 * ACT-USER accepts.
 *
 * <p>What the engine can rely on:
 * <ul>
 *   <li>{@link #getAck} answers the block's acknowledgment (1 IP .. 6 NG), 0 for none.</li>
 *   <li>{@link #getResponseBlock} answers the completion code's number as element 0, then one
 *       element per line: its type digit (0 quoted, 1 plain, 2 comment), '|', its text; or
 *       {"ErrorCode", CODE, TEXT} for a DENY with an error code and nothing else. {CTAG} is left
 *       in the lines for the engine; the other placeholders are replaced.</li>
 *   <li>A command whose code or AID has no block answers the error SCNF; a device that is not
 *       registered answers null.</li>
 *   <li>ACT-USER answers PIUI unless its AID and first parameter are a user and its password of
 *       the device's users (any user passes when it has none), then the file's ACT-USER block or
 *       COMPLD; CANC-USER answers the file's block or COMPLD. The parameters of ACT-USER never
 *       reach a response.</li>
 * </ul>
 */
public class TL1Handler {
  static {
    NativeLibrary.load();
  }

  public static final String ACT_USER = "ACT-USER";
  public static final String CANC_USER = "CANC-USER";
  private static final String ERROR_CODE = "ErrorCode";
  private static final Pattern PLACEHOLDER = Pattern.compile("\\{(SID|AID|DATE|TIME|P[1-9])\\}");
  private static final DateTimeFormatter DATE = DateTimeFormatter.ofPattern("yy-MM-dd");
  private static final DateTimeFormatter TIME = DateTimeFormatter.ofPattern("HH:mm:ss");

  /** A device the handler answers for. */
  private record Device(String sid, String group, TL1Data data, List<TL1User> users) {}

  private final Map<Integer, Device> devices = new ConcurrentHashMap<>();
  private final Clock clock;

  /** A handler whose {DATE} and {TIME} are the local time. */
  public TL1Handler() {
    this(Clock.systemDefaultZone());
  }

  /** A handler whose {DATE} and {TIME} are the time of {@code clock} in its zone. */
  public TL1Handler(Clock clock) {
    this.clock = clock;
  }

  /** Hands this object to the engine, which then asks it for acknowledgments and responses. */
  public native void nativeCacheThisObject(Object handler);

  /** Serves device {@code agentId} (again, replacing what it served before). */
  public void addDevice(int agentId, String sid, String group, TL1Data data, List<TL1User> users) {
    devices.put(agentId, new Device(sid, group, data, List.copyOf(users)));
  }

  public void removeDevice(int agentId) {
    devices.remove(agentId);
  }

  /** The group of device {@code agentId}; empty when it is not served. */
  public Optional<String> group(int agentId) {
    return Optional.ofNullable(devices.get(agentId)).map(Device::group);
  }

  /**
   * The command codes to register with the engine, once each: those of every device's data, then
   * ACT-USER and CANC-USER. The engine answers other codes SCNF without asking.
   */
  public List<String> commandCodes() {
    Set<String> codes = new LinkedHashSet<>();
    devices.values().stream().map(Device::data).distinct().forEach(data -> codes.addAll(data.codes()));
    codes.add(ACT_USER);
    codes.add(CANC_USER);
    return List.copyOf(codes);
  }

  /** The acknowledgment to send before the response: 1 (IP) .. 6 (NG), 0 for none. */
  public int getAck(String verb, String modifier1, String modifier2, String aid, String[] parameters,
      int agentId, int reserved, String hostText1, String hostText2, String hostText3, String hostText2Again) {
    Device device = devices.get(agentId);
    if (device == null) {
      return 0;
    }
    return device.data().find(verb, modifier1, modifier2, aid).map(Block::ack).orElse(0);
  }

  /** The response to a command; see the class comment for its form. */
  public String[] getResponseBlock(String verb, String modifier1, String modifier2, String aid,
      String[] parameters, int agentId, int reserved, String address, int port, String hostText1,
      String hostText2, String hostText3, String hostText2Again) {
    Device device = devices.get(agentId);
    if (device == null) {
      return null;
    }
    String code = TL1Data.join(verb, modifier1, modifier2);
    Optional<Block> block = device.data().find(verb, modifier1, modifier2, aid);
    if (code.equals(ACT_USER)) {
      if (!accepts(device.users(), aid, parameter(parameters, 0))) {
        return error("PIUI");
      }
      parameters = null; // the password stays out of every answer
    }
    if (block.isEmpty()) {
      return code.equals(ACT_USER) || code.equals(CANC_USER) ? new String[] {"1"} : error("SCNF");
    }
    String[] given = parameters;
    return response(block.get(), () -> placeholders(device, aid, given));
  }

  private static boolean accepts(List<TL1User> users, String user, String password) {
    return users.isEmpty() || users.stream()
        .anyMatch(known -> known.user().equals(user) && known.password().equals(password));
  }

  private static String[] error(String code) {
    int number = TL1Codes.errorNumber(code);
    return new String[] {ERROR_CODE, code, TL1Codes.errorText(number)};
  }

  /** The answer of a block; values are asked for only when a line has a placeholder. */
  private static String[] response(Block block, Supplier<Map<String, String>> placeholders) {
    Map<String, String> values = null;
    List<String> answer = new ArrayList<>();
    answer.add(Integer.toString(block.completion()));
    if (block.deny() != null) {
      if (block.lines().isEmpty()) {
        return error(block.deny());
      }
      // A DENY with lines of its own: the error's lines as the engine sets them out, then the file's.
      answer.add(TL1Data.LineType.PLAIN.number() + "|" + block.deny());
      answer.add(TL1Data.LineType.QUOTED.number() + "|" + TL1Codes.errorText(TL1Codes.errorNumber(block.deny())));
    }
    for (Line line : block.lines()) {
      String text = line.text();
      if (text.indexOf('{') >= 0) {
        values = values == null ? placeholders.get() : values;
        text = replace(text, values);
      }
      answer.add(line.type().number() + "|" + text);
    }
    return answer.toArray(new String[0]);
  }

  /** The values of the placeholders in the answer to one command; {CTAG} is the engine's. */
  private Map<String, String> placeholders(Device device, String aid, String[] parameters) {
    LocalDateTime now = LocalDateTime.now(clock);
    Map<String, String> values = new HashMap<>();
    values.put("SID", device.sid());
    values.put("AID", aid == null ? "" : aid);
    values.put("DATE", DATE.format(now));
    values.put("TIME", TIME.format(now));
    for (int i = 0; i < 9; i++) {
      String value = parameter(parameters, i);
      values.put("P" + (i + 1), value == null ? "" : value);
    }
    return values;
  }

  /** Replaces in one pass, so that a value holding a placeholder's name stays as it is. */
  private static String replace(String text, Map<String, String> values) {
    Matcher matcher = PLACEHOLDER.matcher(text);
    StringBuilder replaced = new StringBuilder();
    while (matcher.find()) {
      matcher.appendReplacement(replaced, Matcher.quoteReplacement(values.get(matcher.group(1))));
    }
    matcher.appendTail(replaced);
    return replaced.toString();
  }

  private static String parameter(String[] parameters, int index) {
    return parameters != null && index < parameters.length ? parameters[index] : null;
  }
}
