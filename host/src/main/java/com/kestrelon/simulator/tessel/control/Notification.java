package com.kestrelon.simulator.tessel.control;

import com.google.gson.JsonElement;
import com.google.gson.JsonObject;
import com.google.gson.JsonPrimitive;
import com.kestrelon.simulator.tessel.data.BerType;
import com.kestrelon.simulator.tessel.data.ValueText;
import java.nio.charset.StandardCharsets;
import java.util.ArrayList;
import java.util.BitSet;
import java.util.HexFormat;
import java.util.List;
import java.util.Map;
import java.util.Set;

/**
 * One notification a client asks a device to send, checked in full before anything is sent: the
 * kind, the manager's version and address, the identity (community, or SNMPv3 user and context),
 * the trap (SNMPv2 trap OID, or SNMPv1 enterprise, generic and specific) and the bindings, whose
 * values arrive as net-snmp's snmptrap types them and leave as the engine's value texts.
 * Immutable.
 */
public record Notification(boolean inform, Version version, String managerHost, int managerPort,
    String community, String user, String context, String oid, String enterprise, int generic,
    int specific, List<Binding> bindings, int timeout, int retries) {

  static final int MAX_TIMEOUT = 3600;
  static final int MAX_RETRIES = 100;
  private static final Set<String> FIELDS = Set.of("kind", "version", "manager", "community",
      "user", "context", "oid", "enterprise", "generic", "specific", "varbinds", "timeout", "retries");
  private static final Set<String> BINDING_FIELDS = Set.of("oid", "type", "value");
  private static final Map<String, BerType> TYPES = Map.ofEntries(Map.entry("i", BerType.INTEGER),
      Map.entry("u", BerType.GAUGE32), Map.entry("c", BerType.COUNTER32),
      Map.entry("C", BerType.COUNTER64), Map.entry("s", BerType.OCTET_STRING),
      Map.entry("x", BerType.OCTET_STRING), Map.entry("d", BerType.OCTET_STRING),
      Map.entry("n", BerType.NULL), Map.entry("o", BerType.OBJECT_IDENTIFIER),
      Map.entry("t", BerType.TIME_TICKS), Map.entry("a", BerType.IP_ADDRESS),
      Map.entry("b", BerType.OCTET_STRING));

  /** The manager's SNMP version, with the engine's number of it. */
  public enum Version {
    V1("v1", 0),
    V2C("v2c", 1),
    V3("v3", 3);

    private final String text;
    private final int number;

    Version(String text, int number) {
      this.text = text;
      this.number = number;
    }

    public int number() {
      return number;
    }

    public String text() {
      return text;
    }
  }

  /** A binding as the engine takes it: the OID, the BER type number and the value text. */
  public record Binding(String oid, int type, String value) {}

  public Notification {
    bindings = List.copyOf(bindings);
  }

  /** The manager as text, {@code host:port} ({@code [v6]:port}). */
  public String manager() {
    return (managerHost.contains(":") ? "[" + managerHost + "]" : managerHost) + ":" + managerPort;
  }

  String[] bindingOids() {
    return bindings.stream().map(Binding::oid).toArray(String[]::new);
  }

  int[] bindingTypes() {
    return bindings.stream().mapToInt(Binding::type).toArray();
  }

  String[] bindingValues() {
    return bindings.stream().map(Binding::value).toArray(String[]::new);
  }

  /**
   * The notification a JSON object asks for.
   *
   * @throws IllegalArgumentException with the reason when the object asks for no valid one
   */
  public static Notification parse(JsonObject json) {
    for (String name : json.keySet()) {
      require(FIELDS.contains(name), "unknown field '" + name + "'");
    }
    String kind = text(json, "kind", null);
    require(kind.equals("trap") || kind.equals("inform"), "kind is trap or inform, not '" + kind + "'");
    boolean inform = kind.equals("inform");
    Version version = version(text(json, "version", "v2c"));
    requireFieldsOfForm(json, version, inform);
    String[] manager = manager(text(json, "manager", null));
    boolean v1 = version == Version.V1;
    boolean v3 = version == Version.V3;
    String user = v3 ? text(json, "user", null) : "";
    require(!v3 || !user.isEmpty(), "user must not be empty");
    return new Notification(inform, version, manager[0], Integer.parseInt(manager[1]),
        v3 ? "" : text(json, "community", "public"), user, v3 ? text(json, "context", "") : "",
        v1 ? "" : oid(text(json, "oid", null), "oid"),
        v1 ? oid(text(json, "enterprise", null), "enterprise") : "",
        v1 ? number(json, "generic", 6, 0, 6) : 0, v1 ? number(json, "specific", 0, 0, Integer.MAX_VALUE) : 0,
        bindings(json.get("varbinds")),
        number(json, "timeout", 5, 1, MAX_TIMEOUT), number(json, "retries", 0, 0, MAX_RETRIES));
  }

  /** Refuses the fields that belong to another version's form or to the other kind. */
  private static void requireFieldsOfForm(JsonObject json, Version version, boolean inform) {
    boolean v1 = version == Version.V1;
    boolean v3 = version == Version.V3;
    require(!(inform && v1), "SNMPv1 has no inform; send it as v2c or v3");
    require(v3 || !json.has("user") && !json.has("context"),
        "user and context are for v3; " + version.text + " takes a community");
    require(!v3 || !json.has("community"), "v3 takes a user (and a context), not a community");
    require(v1 || !json.has("enterprise") && !json.has("generic") && !json.has("specific"),
        "enterprise, generic and specific make an SNMPv1 trap; " + version.text + " takes an oid");
    require(!v1 || !json.has("oid"), "an SNMPv1 trap takes enterprise, generic and specific, not an oid");
    require(inform || !json.has("timeout") && !json.has("retries"), "timeout and retries are for informs");
  }

  static Version version(String text) {
    for (Version version : Version.values()) {
      if (version.text.equals(text)) {
        return version;
      }
    }
    throw new IllegalArgumentException("version is v1, v2c or v3, not '" + text + "'");
  }

  /** {host, port} of HOST:PORT, [IPv6]:PORT or a bare host (port 162). */
  static String[] manager(String text) {
    String host = text;
    String port = "162";
    if (text.startsWith("[")) {
      int close = text.indexOf(']');
      require(close > 1, "manager: an IPv6 address goes in brackets, as [::1]:162");
      host = text.substring(1, close);
      String rest = text.substring(close + 1);
      require(rest.isEmpty() || rest.startsWith(":"), "manager: '" + text + "' is not [IPv6]:PORT");
      port = rest.isEmpty() ? port : rest.substring(1);
      require(host.matches("[0-9a-fA-F:.]+"), "manager: '" + host + "' is not an IPv6 address");
    } else if (text.contains(":")) {
      int colon = text.lastIndexOf(':');
      require(colon == text.indexOf(':'), "manager: write an IPv6 address in brackets, as [::1]:162");
      host = text.substring(0, colon);
      port = text.substring(colon + 1);
    }
    require(!host.isEmpty(), "manager: no host in '" + text + "'");
    require(port.matches("[0-9]{1,5}") && Integer.parseInt(port) >= 1 && Integer.parseInt(port) <= 65535,
        "manager: the port is a number from 1 to 65535, not '" + port + "'");
    return new String[] {host, port};
  }

  private static List<Binding> bindings(JsonElement varbinds) {
    List<Binding> bindings = new ArrayList<>();
    if (varbinds == null) {
      return bindings;
    }
    require(varbinds.isJsonArray(), "varbinds takes a list of {\"oid\", \"type\", \"value\"}");
    for (JsonElement element : varbinds.getAsJsonArray()) {
      int n = bindings.size() + 1;
      require(element.isJsonObject(), "varbind " + n + " is not an object {\"oid\", \"type\", \"value\"}");
      JsonObject binding = element.getAsJsonObject();
      for (String name : binding.keySet()) {
        require(BINDING_FIELDS.contains(name), "varbind " + n + ": unknown field '" + name + "'");
      }
      for (String name : BINDING_FIELDS) {
        require(binding.has(name), "varbind " + n + " has no " + name);
      }
      try {
        bindings.add(binding(text(binding, "oid", null), text(binding, "type", null), text(binding, "value", null)));
      } catch (IllegalArgumentException e) {
        throw new IllegalArgumentException("varbind " + n + ": " + e.getMessage(), e);
      }
    }
    return bindings;
  }

  /**
   * A binding from its OID, its type letter as snmptrap takes it and its value text.
   *
   * @throws IllegalArgumentException when the letter is unknown or the value is not of its type
   */
  public static Binding binding(String oid, String letter, String value) {
    BerType type = TYPES.get(letter);
    require(type != null, "unknown type '" + letter + "'; the types are i u c C s x d n o t a b");
    String checkedOid = oid(oid, "oid");
    try {
      return new Binding(checkedOid, type.number(), engineText(letter, type, value));
    } catch (IllegalArgumentException e) {
      throw new IllegalArgumentException("'" + value + "' is not a value of type " + letter + ": " + e.getMessage(), e);
    }
  }

  private static String engineText(String letter, BerType type, String value) {
    return switch (letter) {
      case "s" -> ValueText.octetsText(value.getBytes(StandardCharsets.UTF_8));
      case "x" -> ValueText.octetsText(hex(value));
      case "d" -> ValueText.octetsText(decimalOctets(value));
      case "b" -> ValueText.octetsText(bits(value));
      case "n" -> "";
      default -> ValueText.canonical(type, value);
    };
  }

  /** Hex digits, pairs optionally apart by spaces: {@code 0a1b} or {@code 0a 1b}. */
  private static byte[] hex(String value) {
    String digits = value.replace(" ", "");
    require(digits.length() % 2 == 0 && digits.chars().allMatch(HexFormat::isHexDigit),
        "hex digits in pairs are needed");
    return HexFormat.of().parseHex(digits);
  }

  /** Octets in decimal apart by dots or spaces: {@code 10.0.255}. */
  private static byte[] decimalOctets(String value) {
    String[] parts = value.strip().split("[. ]+");
    byte[] octets = new byte[value.isBlank() ? 0 : parts.length];
    for (int i = 0; i < octets.length; i++) {
      require(parts[i].matches("[0-9]{1,3}") && Integer.parseInt(parts[i]) <= 255, "octets are 0 to 255");
      octets[i] = (byte) Integer.parseInt(parts[i]);
    }
    return octets;
  }

  /** BITS: the numbers of the bits set, apart by commas or spaces; bit 0 is the first octet's highest. */
  private static byte[] bits(String value) {
    BitSet set = new BitSet();
    int highest = -1;
    for (String part : value.strip().split("[, ]+")) {
      if (part.isEmpty()) {
        continue;
      }
      require(part.matches("[0-9]{1,4}") && Integer.parseInt(part) < 2048, "bit numbers are 0 to 2047");
      set.set(Integer.parseInt(part));
      highest = Math.max(highest, Integer.parseInt(part));
    }
    byte[] octets = new byte[highest / 8 + 1];
    set.stream().forEach(bit -> octets[bit / 8] |= (byte) (0x80 >>> (bit % 8)));
    return highest < 0 ? new byte[0] : octets;
  }

  private static String oid(String text, String name) {
    try {
      return ValueText.parseOidValue(text).toDottedText();
    } catch (IllegalArgumentException e) {
      throw new IllegalArgumentException(name + " '" + text + "' is not an OID: " + e.getMessage(), e);
    }
  }

  private static String text(JsonObject json, String name, String absent) {
    JsonElement element = json.get(name);
    if (element == null) {
      require(absent != null, "no " + name + " given");
      return absent;
    }
    require(element.isJsonPrimitive() && element.getAsJsonPrimitive().isString(), name + " takes a string");
    return element.getAsString();
  }

  private static int number(JsonObject json, String name, int absent, int min, int max) {
    JsonElement element = json.get(name);
    if (element == null) {
      return absent;
    }
    boolean whole = element.isJsonPrimitive() && element.getAsJsonPrimitive().isNumber()
        && wholeNumber(element.getAsJsonPrimitive(), min, max);
    require(whole, name + " takes a whole number from " + min + " to " + max + ", not " + element);
    return element.getAsInt();
  }

  private static boolean wholeNumber(JsonPrimitive number, int min, int max) {
    try {
      long value = number.getAsBigDecimal().longValueExact();
      return value >= min && value <= max;
    } catch (ArithmeticException e) {
      return false;
    }
  }

  private static void require(boolean condition, String reason) {
    if (!condition) {
      throw new IllegalArgumentException(reason);
    }
  }
}
