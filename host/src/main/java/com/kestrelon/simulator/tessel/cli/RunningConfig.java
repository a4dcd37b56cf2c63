package com.kestrelon.simulator.tessel.cli;

import java.util.ArrayList;
import java.util.List;
import java.util.Locale;
import java.util.Set;

/**
 * One device's configuration in the router's layout: global lines, blocks (a header such as
 * {@code interface GigabitEthernet0/1} with its lines, shown indented by one space) and the
 * {@code !} separators between groups of lines. A {@code hostname} line is always present. Not
 * thread-safe: its device serialises the changes.
 */
final class RunningConfig {
  static final String DEFAULT_HOSTNAME = "Router";
  private static final String HOSTNAME = "hostname";
  private static final String INTERFACE = "interface ";
  /** The first words of lines that open a block even while it is empty. */
  private static final Set<String> BLOCKS = Set.of("interface", "router", "line", "vlan");

  /** A global line, a block, or a separator (a block with a null header). */
  private static final class Entry {
    final String text;
    final List<String> lines; // null for a global line or a separator

    Entry(String text, List<String> lines) {
      this.text = text;
      this.lines = lines;
    }

    boolean isBlock() {
      return lines != null;
    }

    boolean isSeparator() {
      return text == null;
    }

    Entry copy() {
      return new Entry(text, lines == null ? null : new ArrayList<>(lines));
    }
  }

  /** An interface as the show commands describe it. */
  record InterfaceState(String name, String description, String address, String mask, boolean shutdown) {}

  private final List<Entry> entries;

  private RunningConfig(List<Entry> entries) {
    this.entries = entries;
  }

  /**
   * The configuration the lines describe ("!" a separator, an indented line part of the block the
   * line before opens, "end" ignored), named {@code hostname}.
   */
  static RunningConfig of(List<String> lines, String hostname) {
    List<Entry> entries = new ArrayList<>();
    for (String line : lines) {
      if (line.equals("!")) {
        entries.add(new Entry(null, null));
      } else if (line.startsWith(" ")) {
        Entry last = entries.get(entries.size() - 1);
        if (!last.isBlock()) {
          last = new Entry(last.text, new ArrayList<>());
          entries.set(entries.size() - 1, last);
        }
        last.lines.add(line.strip());
      } else if (!line.equals("end")) {
        boolean block = BLOCKS.contains(line.split(" ", 2)[0].toLowerCase(Locale.ROOT));
        entries.add(new Entry(line, block ? new ArrayList<>() : null));
      }
    }
    RunningConfig config = new RunningConfig(entries);
    config.setHostname(hostname);
    return config;
  }

  RunningConfig copy() {
    List<Entry> copied = new ArrayList<>();
    entries.forEach(entry -> copied.add(entry.copy()));
    return new RunningConfig(copied);
  }

  String hostname() {
    Entry line = globalWithKey(HOSTNAME);
    return line.text.substring(HOSTNAME.length()).strip();
  }

  void setHostname(String name) {
    Entry line = globalWithKey(HOSTNAME);
    Entry named = new Entry(HOSTNAME + " " + name, null);
    if (line == null) {
      entries.add(0, named);
    } else {
      entries.set(entries.indexOf(line), named);
    }
  }

  /** Opens (creates when missing) the block with that header. */
  void openBlock(String header) {
    if (block(header) != null) {
      return;
    }
    String kind = header.split(" ", 2)[0].toLowerCase(Locale.ROOT);
    int at = -1;
    for (int i = 0; i < entries.size(); i++) {
      Entry entry = entries.get(i);
      if (entry.isBlock() && (at < 0 || entry.text.toLowerCase(Locale.ROOT).startsWith(kind + " "))) {
        at = i;
      }
    }
    // After the last block of its kind, else after the last block, else at the end.
    entries.add(at < 0 ? entries.size() : at + 1, new Entry(header, new ArrayList<>()));
  }

  /** Removes the block with that header; false when there is none. */
  boolean removeBlock(String header) {
    Entry block = block(header);
    return block != null && entries.remove(block);
  }

  /**
   * Stores a line in a block (opened when missing) or, for a null block, globally. With a key, it
   * takes the place of the first line with that key (or of its "no" form) and the others with the
   * key go, so that storing the same line again changes nothing; without, it is added once.
   */
  void store(String blockHeader, String key, String line) {
    List<String> lines = blockHeader == null ? null : lines(blockHeader);
    if (key == null && contains(blockHeader, line)) {
      return;
    }
    if (lines != null) {
      int at = key == null ? -1 : indexOfKey(lines, key);
      if (at >= 0) {
        lines.removeIf(other -> sameOrKeyed(other, key, true) || other.equalsIgnoreCase("no " + key));
        lines.add(Math.min(at, lines.size()), line);
      } else {
        lines.add(line);
      }
      return;
    }
    List<String> globals = new ArrayList<>();
    entries.forEach(entry -> globals.add(entry.isBlock() || entry.isSeparator() ? "" : entry.text));
    int at = key == null ? -1 : indexOfKey(globals, key);
    if (at >= 0) {
      entries.set(at, new Entry(line, null));
      for (int i = entries.size() - 1; i > at; i--) {
        if (!globals.get(i).isEmpty() && (sameOrKeyed(globals.get(i), key, true)
            || globals.get(i).equalsIgnoreCase("no " + key))) {
          entries.remove(i);
        }
      }
      return;
    }
    entries.add(globalPosition(line), new Entry(line, null));
  }

  /** The first of the lines with the key, or in its "no" form; -1 for none. */
  private static int indexOfKey(List<String> lines, String key) {
    for (int i = 0; i < lines.size(); i++) {
      if (sameOrKeyed(lines.get(i), key, true) || lines.get(i).equalsIgnoreCase("no " + key)) {
        return i;
      }
    }
    return -1;
  }

  /**
   * Where a new global line goes: after the last line that shares its first two words, else its
   * first word, else after the last global line, so that like lines stay together.
   */
  private int globalPosition(String line) {
    String[] words = line.toLowerCase(Locale.ROOT).split(" ");
    int[] after = new int[3]; // by the number of leading words shared: 0, 1, 2
    for (int i = 0; i < entries.size(); i++) {
      Entry entry = entries.get(i);
      if (entry.isBlock() || entry.isSeparator()) {
        continue;
      }
      String[] own = entry.text.toLowerCase(Locale.ROOT).split(" ");
      int shared = 0;
      while (shared < 2 && shared < own.length && shared < words.length && own[shared].equals(words[shared])) {
        shared++;
      }
      for (int s = 0; s <= shared; s++) {
        after[s] = i + 1;
      }
    }
    return after[2] > 0 ? after[2] : after[1] > 0 ? after[1] : after[0];
  }

  /** Removes the lines equal to {@code text} or, with {@code byKey}, starting with it as whole words. */
  void remove(String blockHeader, String text, boolean byKey) {
    if (blockHeader != null) {
      Entry block = block(blockHeader);
      if (block != null) {
        block.lines.removeIf(line -> sameOrKeyed(line, text, byKey));
      }
      return;
    }
    entries.removeIf(entry -> !entry.isBlock() && !entry.isSeparator() && sameOrKeyed(entry.text, text, byKey));
  }

  private boolean contains(String blockHeader, String line) {
    if (blockHeader != null) {
      return lines(blockHeader).stream().anyMatch(line::equalsIgnoreCase);
    }
    return entries.stream().anyMatch(entry -> !entry.isBlock() && line.equalsIgnoreCase(entry.text));
  }

  private static boolean sameOrKeyed(String line, String text, boolean byKey) {
    String lower = line.toLowerCase(Locale.ROOT);
    String wanted = text.toLowerCase(Locale.ROOT);
    return lower.equals(wanted) || (byKey && lower.startsWith(wanted + " "));
  }

  /** The configuration as {@code show running-config} prints it, from its first "!" to "end". */
  String text() {
    StringBuilder text = new StringBuilder("!\n");
    boolean separated = true;
    for (Entry entry : entries) {
      if (entry.isSeparator()) {
        if (!separated) {
          text.append("!\n");
        }
        separated = true;
      } else if (entry.isBlock()) {
        if (!separated) {
          text.append("!\n");
        }
        text.append(entry.text).append('\n');
        entry.lines.forEach(line -> text.append(' ').append(line).append('\n'));
        text.append("!\n");
        separated = true;
      } else {
        text.append(entry.text).append('\n');
        separated = false;
      }
    }
    if (!separated) {
      text.append("!\n");
    }
    return text.append("end").toString();
  }

  /** The interfaces in configuration order. */
  List<InterfaceState> interfaces() {
    List<InterfaceState> interfaces = new ArrayList<>();
    for (Entry entry : entries) {
      if (entry.isBlock() && entry.text.toLowerCase(Locale.ROOT).startsWith(INTERFACE)) {
        String description = null;
        String address = null;
        String mask = null;
        boolean shutdown = false;
        for (String line : entry.lines) {
          String[] words = line.split("\\s+");
          if (words[0].equals("description")) {
            description = line.substring("description".length()).strip();
          } else if (words.length >= 4 && words[0].equals("ip") && words[1].equals("address")) {
            address = words[2];
            mask = words[3];
          } else if (line.equals("shutdown")) {
            shutdown = true;
          }
        }
        interfaces.add(new InterfaceState(entry.text.substring(INTERFACE.length()).strip(), description, address, mask,
            shutdown));
      }
    }
    return interfaces;
  }

  private List<String> lines(String header) {
    openBlock(header);
    return block(header).lines;
  }

  private Entry block(String header) {
    return entries.stream().filter(entry -> entry.isBlock() && entry.text.equalsIgnoreCase(header)).findFirst()
        .orElse(null);
  }

  private Entry globalWithKey(String key) {
    return entries.stream().filter(entry -> !entry.isBlock() && !entry.isSeparator()
        && sameOrKeyed(entry.text, key, true)).findFirst().orElse(null);
  }
}
