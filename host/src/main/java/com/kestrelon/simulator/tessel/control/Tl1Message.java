package com.kestrelon.simulator.tessel.control;

import com.google.gson.JsonArray;
import com.google.gson.JsonElement;
import com.google.gson.JsonObject;
import java.util.ArrayList;
import java.util.List;
import java.util.Set;

/**
 * One autonomous message a client asks a device to send to its TL1 clients, checked in full
 * before anything is queued: the severity (the alarm code), the verb, up to two modifiers and the
 * text lines. Immutable.
 */
public record Tl1Message(Severity severity, String verb, List<String> modifiers, List<Line> lines) {
  private static final Set<String> FIELDS = Set.of("severity", "verb", "modifiers", "lines");
  private static final Set<String> LINE_FIELDS = Set.of("type", "text");
  private static final String WORD = "[A-Za-z][A-Za-z0-9]{0,31}";

  /** The alarm code a severity sends, in the engine's numbering. */
  public enum Severity {
    CRITICAL("critical"),
    MAJOR("major"),
    MINOR("minor"),
    NON_ALARM("non-alarm");

    private final String text;

    Severity(String text) {
      this.text = text;
    }

    public String text() {
      return text;
    }

    /** The engine's alarm code: 0 sends {@code *C}, 1 {@code **}, 2 {@code * }, 3 {@code A }. */
    public byte code() {
      return (byte) ordinal();
    }

    static Severity ofText(String text) {
      for (Severity severity : values()) {
        if (severity.text.equals(text)) {
          return severity;
        }
      }
      return null;
    }
  }

  /** How a line is written: in double quotes, as it is, or between comment marks. */
  public enum LineType {
    QUOTED("quoted", 0),
    PLAIN("plain", 1),
    COMMENT("comment", 2);

    private final String text;
    private final int engineType;

    LineType(String text, int engineType) {
      this.text = text;
      this.engineType = engineType;
    }

    /** The engine's number of the line type. */
    public int engineType() {
      return engineType;
    }

    static LineType ofText(String text) {
      for (LineType type : values()) {
        if (type.text.equals(text)) {
          return type;
        }
      }
      return null;
    }
  }

  public record Line(LineType type, String text) {}

  public Tl1Message {
    modifiers = List.copyOf(modifiers);
    lines = List.copyOf(lines);
  }

  /** The messages of a body: one object, or an array of them queued together. */
  public static List<Tl1Message> parseAll(JsonElement body) {
    if (body.isJsonObject()) {
      return List.of(parse(body.getAsJsonObject()));
    }
    if (!body.isJsonArray() || body.getAsJsonArray().isEmpty()) {
      throw new IllegalArgumentException("the body is a message object or a non-empty array of them");
    }
    List<Tl1Message> messages = new ArrayList<>();
    for (JsonElement element : body.getAsJsonArray()) {
      if (!element.isJsonObject()) {
        throw new IllegalArgumentException("each message is a JSON object");
      }
      messages.add(parse(element.getAsJsonObject()));
    }
    return messages;
  }

  /** Reads one message; any fault is an IllegalArgumentException saying what is wrong. */
  public static Tl1Message parse(JsonObject json) {
    checkFields(json, FIELDS, "a message");
    Severity severity = Severity.ofText(text(json, "severity"));
    if (severity == null) {
      throw new IllegalArgumentException("severity is critical, major, minor or non-alarm");
    }
    String verb = word(text(json, "verb"), "verb");
    List<String> modifiers = new ArrayList<>();
    if (json.has("modifiers")) {
      JsonArray array = array(json, "modifiers");
      if (array.size() > 2) {
        throw new IllegalArgumentException("a message has at most two modifiers");
      }
      for (JsonElement modifier : array) {
        modifiers.add(word(string(modifier, "a modifier"), "a modifier"));
      }
    }
    List<Line> lines = new ArrayList<>();
    if (json.has("lines")) {
      for (JsonElement element : array(json, "lines")) {
        lines.add(line(element));
      }
    }
    return new Tl1Message(severity, verb, modifiers, lines);
  }

  private static Line line(JsonElement element) {
    if (!element.isJsonObject()) {
      throw new IllegalArgumentException("each line is an object with type and text");
    }
    JsonObject json = element.getAsJsonObject();
    checkFields(json, LINE_FIELDS, "a line");
    LineType type = LineType.ofText(text(json, "type"));
    if (type == null) {
      throw new IllegalArgumentException("a line's type is quoted, plain or comment");
    }
    String text = text(json, "text");
    // A line break or another control character would forge lines of the message's frame.
    if (text.chars().anyMatch(c -> c < 0x20 || c == 0x7F)) {
      throw new IllegalArgumentException("a line's text may not hold control characters");
    }
    if (type == LineType.QUOTED && text.indexOf('"') >= 0 || type == LineType.COMMENT && text.contains("*/")) {
      throw new IllegalArgumentException("a " + type.text + " line's text may not close it early: " + text);
    }
    return new Line(type, text);
  }

  private static void checkFields(JsonObject json, Set<String> known, String what) {
    for (String name : json.keySet()) {
      if (!known.contains(name)) {
        throw new IllegalArgumentException("unknown field '" + name + "' in " + what + "; known: "
            + String.join(", ", known.stream().sorted().toList()));
      }
    }
  }

  private static String text(JsonObject json, String name) {
    if (!json.has(name)) {
      throw new IllegalArgumentException(name + " is missing");
    }
    return string(json.get(name), name);
  }

  private static String string(JsonElement element, String name) {
    if (!element.isJsonPrimitive() || !element.getAsJsonPrimitive().isString()) {
      throw new IllegalArgumentException(name + " takes a string");
    }
    return element.getAsString();
  }

  private static JsonArray array(JsonObject json, String name) {
    if (!json.get(name).isJsonArray()) {
      throw new IllegalArgumentException(name + " takes an array");
    }
    return json.getAsJsonArray(name);
  }

  private static String word(String text, String name) {
    if (!text.matches(WORD)) {
      throw new IllegalArgumentException(name + " is a TL1 word (a letter, then letters and digits): " + text);
    }
    return text.toUpperCase(java.util.Locale.ROOT);
  }
}
