package com.kestrelon.simulator.tessel.control;

import com.google.gson.JsonElement;
import com.google.gson.JsonObject;
import com.kestrelon.simulator.tessel.snmp.SnmpHandler;
import java.math.BigDecimal;
import java.util.Collections;
import java.util.Hashtable;
import java.util.LinkedHashMap;
import java.util.LinkedHashSet;
import java.util.List;
import java.util.Map;
import java.util.Optional;
import java.util.Set;
import java.util.function.Function;
import java.util.function.IntConsumer;

/**
 * PDU scrambling: the header fields that chosen devices replace in the requests they receive and
 * the replies they send, to play a misbehaving agent. While no setting is active the engine is
 * told to ask nothing, so the devices pay nothing for it.
 */
public final class Scrambling implements SnmpHandler.Scrambler {
  private static final Set<String> FIELDS = Set.of("devices", "requests", "responses");
  private static final Set<String> INT_KEYS = Set.of("errstat", "errindex", "reqid", "timeout", "retries");
  private static final Set<String> KEYS = Set.of("errstat", "errindex", "reqid", "timeout", "retries",
      "command", "community", "oid");
  private static final int MAX_COMMUNITY = 255;

  /**
   * What is replaced: for the devices listed (empty: every device) the fields of requests and of
   * replies, each key with its Integer, Byte or String value.
   */
  public record Setting(List<String> devices, Map<String, Object> requests, Map<String, Object> responses) {
    /** The setting as the control interface shows it. */
    public Map<String, Object> json() {
      Map<String, Object> json = new LinkedHashMap<>();
      json.put("enabled", true);
      json.put("devices", devices.isEmpty() ? "all" : devices);
      json.put("requests", unsigned(requests));
      json.put("responses", unsigned(responses));
      return json;
    }

    private static Map<String, Object> unsigned(Map<String, Object> fields) {
      Map<String, Object> json = new LinkedHashMap<>(fields);
      json.computeIfPresent("command", (key, value) -> Byte.toUnsignedInt((Byte) value));
      return json;
    }
  }

  private final IntConsumer engineSwitch;
  /** The setting with its devices as a set, replaced whole so a reader never sees a mix. */
  private record Active(Setting setting, Set<String> devices) {}

  private volatile Active active;

  /** engineSwitch turns the engine's scrambling on (1) and off (0). */
  public Scrambling(IntConsumer engineSwitch) {
    this.engineSwitch = engineSwitch;
  }

  /**
   * The setting a control request asks for; deviceAddress gives a known device's address in its
   * table spelling. Throws IllegalArgumentException with the reason for anything else.
   */
  public static Setting parse(JsonObject body, Function<String, Optional<String>> deviceAddress) {
    for (String name : body.keySet()) {
      if (!FIELDS.contains(name)) {
        throw new IllegalArgumentException("unknown field '" + name + "'; known: devices, requests, responses");
      }
    }
    return new Setting(devices(body.get("devices"), deviceAddress), fields(body, "requests"),
        fields(body, "responses"));
  }

  private static List<String> devices(JsonElement json, Function<String, Optional<String>> deviceAddress) {
    if (json == null || (json.isJsonPrimitive() && json.getAsJsonPrimitive().isString()
        && json.getAsString().equals("all"))) {
      return List.of();
    }
    if (!json.isJsonArray() || json.getAsJsonArray().isEmpty()) {
      throw new IllegalArgumentException("devices takes \"all\" or a non-empty list of device addresses");
    }
    Set<String> addresses = new LinkedHashSet<>();
    for (JsonElement element : json.getAsJsonArray()) {
      if (!element.isJsonPrimitive() || !element.getAsJsonPrimitive().isString()) {
        throw new IllegalArgumentException("devices lists addresses as strings, not " + element);
      }
      String address = element.getAsString();
      addresses.add(deviceAddress.apply(address)
          .orElseThrow(() -> new IllegalArgumentException("no device at " + address)));
    }
    return List.copyOf(addresses);
  }

  private static Map<String, Object> fields(JsonObject body, String name) {
    JsonElement json = body.get(name);
    if (json == null) {
      return Map.of();
    }
    if (!json.isJsonObject()) {
      throw new IllegalArgumentException(name + " takes an object of the fields to replace");
    }
    Map<String, Object> fields = new LinkedHashMap<>();
    for (Map.Entry<String, JsonElement> entry : json.getAsJsonObject().entrySet()) {
      String key = entry.getKey();
      if (!KEYS.contains(key)) {
        throw new IllegalArgumentException("unknown field '" + key + "' in " + name
            + "; known: reqid, errstat, errindex, command, community, oid, timeout, retries");
      }
      fields.put(key, value(name + "." + key, key, entry.getValue()));
    }
    return Collections.unmodifiableMap(fields);
  }

  private static Object value(String where, String key, JsonElement json) {
    if (INT_KEYS.contains(key)) {
      return (int) whole(where, json, Integer.MIN_VALUE, Integer.MAX_VALUE);
    }
    if (key.equals("command")) {
      return (byte) whole(where, json, 0, 255);
    }
    String text = json.isJsonPrimitive() && json.getAsJsonPrimitive().isString() ? json.getAsString() : null;
    if (key.equals("community") && text != null && text.length() <= MAX_COMMUNITY) {
      return text;
    }
    if (key.equals("oid") && text != null && text.matches("\\.?[0-9]{1,10}(\\.[0-9]{1,10}){1,127}")) {
      return text;
    }
    throw new IllegalArgumentException(where + (key.equals("oid")
        ? " takes a dotted OID such as \"1.3.6.1.4.1.99\"" : " takes a string of at most 255 characters"));
  }

  private static long whole(String where, JsonElement json, long min, long max) {
    if (json.isJsonPrimitive() && json.getAsJsonPrimitive().isNumber()) {
      try {
        long value = new BigDecimal(json.getAsString()).longValueExact();
        if (value >= min && value <= max) {
          return value;
        }
      } catch (ArithmeticException | NumberFormatException e) {
        // not a whole number: refused below
      }
    }
    throw new IllegalArgumentException(where + " takes a whole number from " + min + " to " + max + ", not " + json);
  }

  /** Replaces the active setting and has the engine scramble. */
  public synchronized void set(Setting next) {
    active = new Active(next, Set.copyOf(next.devices()));
    engineSwitch.accept(1);
  }

  /** Has the engine stop scrambling: it then asks nothing at all. */
  public synchronized void off() {
    engineSwitch.accept(0);
    active = null;
  }

  /** The active setting, or nothing while scrambling is off. */
  public Optional<Setting> current() {
    Active now = active;
    return now == null ? Optional.empty() : Optional.of(now.setting());
  }

  @Override
  public Hashtable<String, Object> scramble(String agentAddress, boolean isResponse) {
    Active now = active;
    if (now == null || !(now.devices().isEmpty() || now.devices().contains(agentAddress))) {
      return null;
    }
    Setting setting = now.setting();
    return new Hashtable<>(isResponse ? setting.responses() : setting.requests());
  }
}
