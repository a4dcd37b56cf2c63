package com.kestrelon.simulator.tessel.cli;

import com.kestrelon.simulator.tessel.cli.RunningConfig.InterfaceState;
import java.nio.charset.StandardCharsets;
import java.util.ArrayList;
import java.util.List;
import java.util.Locale;

/** The texts of the show commands generated from a device's configuration. */
final class ShowText {
  /** The size of the simulated configuration memory, as show startup-config reports it. */
  private static final int STARTUP_MEMORY = 262_144;
  private static final String BRIEF_FORMAT = "%-27s%-16s%-4s%-7s%-22s%s";

  private ShowText() {}

  static String runningConfig(RunningConfig config) {
    String body = config.text();
    return "Building configuration...\n\nCurrent configuration : " + size(body) + " bytes\n" + body;
  }

  static String startupConfig(RunningConfig config) {
    String body = config.text();
    return "Using " + size(body) + " out of " + STARTUP_MEMORY + " bytes\n" + body;
  }

  /** Bytes as the device would store the text: with CR LF line ends. */
  private static int size(String body) {
    return body.getBytes(StandardCharsets.UTF_8).length + (int) body.chars().filter(c -> c == '\n').count();
  }

  /** show interfaces: every interface, or the one named (empty text when there is no such interface). */
  static String interfaces(List<InterfaceState> interfaces, String only, String deviceAddress) {
    List<String> lines = new ArrayList<>();
    for (int i = 0; i < interfaces.size(); i++) {
      InterfaceState state = interfaces.get(i);
      if (only == null || state.name().equalsIgnoreCase(only)) {
        describe(state, i + 1, deviceAddress, lines);
      }
    }
    return String.join("\n", lines);
  }

  private static void describe(InterfaceState state, int index, String deviceAddress, List<String> lines) {
    String lower = state.name().toLowerCase(Locale.ROOT);
    lines.add(state.name() + " is " + (state.shutdown() ? "administratively down" : "up") + ", line protocol is "
        + (state.shutdown() ? "down" : "up"));
    if (lower.startsWith("loopback")) {
      lines.add("  Hardware is Loopback");
    } else {
      String kind = lower.startsWith("vlan") ? "EtherSVI" : lower.startsWith("fast") ? "Fast Ethernet" : "Gigabit Ethernet";
      String mac = mac(deviceAddress, index);
      lines.add("  Hardware is " + kind + ", address is " + mac + " (bia " + mac + ")");
    }
    if (state.description() != null) {
      lines.add("  Description: " + state.description());
    }
    if (state.address() != null) {
      lines.add("  Internet address is " + state.address() + "/" + prefixLength(state.mask()));
    }
    boolean loopback = lower.startsWith("loopback");
    lines.add("  MTU " + (loopback ? 1514 : 1500) + " bytes, BW " + (loopback ? 8000000 : 1000000)
        + " Kbit/sec, DLY " + (loopback ? 5000 : 10) + " usec,");
    lines.add("     reliability 255/255, txload 1/255, rxload 1/255");
    lines.add("  Encapsulation " + (loopback ? "LOOPBACK" : "ARPA") + ", loopback not set");
    lines.add("  Last input never, output never, output hang never");
    lines.add("  5 minute input rate 0 bits/sec, 0 packets/sec");
    lines.add("  5 minute output rate 0 bits/sec, 0 packets/sec");
    lines.add("     0 packets input, 0 bytes, 0 no buffer");
    lines.add("     0 packets output, 0 bytes, 0 underruns");
  }

  /** show ip interface brief. */
  static String ipInterfaceBrief(List<InterfaceState> interfaces) {
    List<String> lines = new ArrayList<>();
    lines.add(String.format(Locale.ROOT, BRIEF_FORMAT, "Interface", "IP-Address", "OK?", "Method", "Status",
        "Protocol"));
    for (InterfaceState state : interfaces) {
      lines.add(String.format(Locale.ROOT, BRIEF_FORMAT, state.name(),
          state.address() == null ? "unassigned" : state.address(), "YES", state.address() == null ? "unset" : "manual",
          state.shutdown() ? "administratively down" : "up", state.shutdown() ? "down" : "up"));
    }
    return String.join("\n", lines);
  }

  /** A stable hardware address per device and interface: 5254.XXYY.ZZNN from the device's address. */
  private static String mac(String deviceAddress, int index) {
    String[] octets = deviceAddress.split("\\.");
    int[] bytes = new int[4];
    for (int i = 0; i < 4 && i < octets.length; i++) {
      bytes[i] = octets[i].matches("[0-9]{1,3}") ? Integer.parseInt(octets[i]) & 0xFF : 0;
    }
    return String.format(Locale.ROOT, "5254.%02x%02x.%02x%02x", bytes[1], bytes[2], bytes[3], index & 0xFF);
  }

  /** The prefix length of a dotted mask; the mask itself when it is not one. */
  static String prefixLength(String mask) {
    String[] octets = mask.split("\\.");
    if (octets.length != 4) {
      return mask;
    }
    long bits = 0;
    for (String octet : octets) {
      if (!octet.matches("[0-9]{1,3}") || Integer.parseInt(octet) > 255) {
        return mask;
      }
      bits = (bits << 8) | Integer.parseInt(octet);
    }
    int length = Long.bitCount(bits);
    long expected = length == 0 ? 0 : (0xFFFF_FFFFL << (32 - length)) & 0xFFFF_FFFFL;
    return bits == expected ? Integer.toString(length) : mask;
  }
}
