package com.kestrelon.simulator.tessel.cli;

import com.kestrelon.simulator.tessel.data.DataFiles;
import com.kestrelon.simulator.tessel.data.DeviceDataException;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.HashMap;
import java.util.LinkedHashMap;
import java.util.List;
import java.util.Locale;
import java.util.Map;
import java.util.Set;
import java.util.regex.Matcher;
import java.util.regex.Pattern;

/**
 * What a CLI device understands, read from a CLI data file: the commands of each mode with their
 * help texts and what they do, the interface types its interface names abbreviate, the modes a
 * file adds above the built-in ones, and the configuration every device starts from. Immutable
 * once read, so any number of threads may use it.
 *
 * <p>The file, line by line (blank lines and lines starting with {@code #} are skipped):
 * <ul>
 *   <li>before the first section: {@code interface-types NAME...} and
 *       {@code mode NAME NUMBER SUFFIX} (a mode of its own, numbered above 15, whose prompt is the
 *       device name followed by SUFFIX);</li>
 *   <li>{@code [MODE, MODE...]} opens a section of commands for those modes (user, enable,
 *       config, interface, router, line, vlan or an added mode); {@code [running-config]} opens
 *       the configuration the devices start from, in the router's own layout;</li>
 *   <li>{@code PATTERN "HELP" [-> MODE] [=> ACTION]} is a command: keywords, which may be
 *       abbreviated, and the placeholders WORD, NUMBER, LINE (the rest of the line) and
 *       INTERFACE; a token in brackets is optional (only at the end);</li>
 *   <li>{@code | TEXT} lines after a command are its output; {@code ? WORDS "HELP"} gives the help
 *       of a keyword that leads to further words (such as {@code show}).</li>
 * </ul>
 * A command with neither output nor action is stored in the configuration in a configuration
 * mode and does nothing in an EXEC mode.
 */
public final class CliData {
  public static final int USER = 5;
  public static final int ENABLE = 6;
  public static final int CONFIG = 7;
  public static final int INTERFACE = 9;
  public static final int ROUTER = 10;
  public static final int LINE = 11;
  public static final int VLAN = 12;
  /** Modes a file adds are numbered above this. */
  public static final int LAST_BUILT_IN = 15;

  private static final Map<String, Integer> BUILT_IN_MODES = Map.of("user", USER, "enable", ENABLE,
      "config", CONFIG, "interface", INTERFACE, "router", ROUTER, "line", LINE, "vlan", VLAN);
  private static final Map<Integer, String> BUILT_IN_SUFFIXES = Map.of(USER, ">", ENABLE, "#",
      CONFIG, "(config)#", INTERFACE, "(config-if)#", ROUTER, "(config-router)#", LINE, "(config-line)#",
      VLAN, "(config-vlan)#");
  private static final Set<String> PLACEHOLDERS = Set.of("WORD", "NUMBER", "LINE", "INTERFACE");
  private static final Pattern SECTION = Pattern.compile("\\[([^\\]]*)\\]\\s*");
  private static final Pattern ADDED_MODE = Pattern.compile("mode\\s+([a-z][a-z0-9-]*)\\s+([0-9]{1,9})\\s+(\\S+)\\s*");
  private static final String RUNNING_CONFIG = "running-config";

  /** What a command does besides printing its output. */
  public enum Action {
    OUTPUT("output"), MODE("mode"), RUNNING_CONFIG("running-config"), STARTUP_CONFIG("startup-config"),
    INTERFACES("interfaces"), IP_INTERFACE_BRIEF("ip-interface-brief"), WRITE("write"), HOSTNAME("hostname"),
    SET("set"), ADD("add"), NO("no"), EXIT("exit"), END("end"), LOGOUT("logout"), DO("do"), SILENT("silent");

    private final String word;

    Action(String word) {
      this.word = word;
    }

    /** The actions a file may name after {@code =>}. */
    static List<String> words() {
      return List.of(values()).subList(2, values().length).stream().map(action -> action.word).toList();
    }

    static Action ofWord(String word) {
      for (Action action : values()) {
        if (action.ordinal() >= 2 && action.word.equals(word)) {
          return action;
        }
      }
      return null;
    }
  }

  /** One token of a pattern: a keyword as written, or a placeholder's name. */
  public record Token(String text, boolean placeholder, boolean optional) {
    boolean isLine() {
      return placeholder && text.equals("LINE");
    }
  }

  /**
   * One command of a mode.
   *
   * @param targetMode the mode a MODE command enters
   * @param line the line of the file it is on
   */
  public record Command(List<Token> tokens, String help, List<String> output, Action action, int targetMode,
      int line) {
    public Command {
      tokens = List.copyOf(tokens);
      output = List.copyOf(output);
    }

    /** The keywords before the first placeholder: lines with the same key replace each other (SET). */
    public String key() {
      List<String> words = new ArrayList<>();
      for (Token token : tokens) {
        if (token.placeholder()) {
          break;
        }
        words.add(token.text());
      }
      return String.join(" ", words);
    }

    /** Whether the command opens a configuration block (interface, router, ...). */
    public boolean opensBlock() {
      return action == Action.MODE && targetMode >= INTERFACE;
    }
  }

  /** A mode a file adds: its number (above 15) and the prompt after the device name. */
  public record AddedMode(String name, int number, String suffix) {}

  private final String name;
  private final Map<Integer, List<Command>> commands;
  private final Map<Integer, Map<String, String>> help;
  private final List<String> interfaceTypes;
  private final List<AddedMode> addedModes;
  private final List<String> configuration;

  private CliData(Reader reader) {
    name = reader.name;
    commands = reader.commands;
    help = reader.help;
    interfaceTypes = List.copyOf(reader.interfaceTypes);
    addedModes = List.copyOf(reader.addedModes.values());
    configuration = List.copyOf(reader.configuration);
  }

  /** Reads a CLI data file; the faults name it as {@code file} is written. */
  public static CliData load(Path file) throws DeviceDataException {
    return parse(file.toString(), DataFiles.read(file));
  }

  /** Reads the text of a CLI data file; the faults name it {@code name}. */
  public static CliData parse(String name, String text) throws DeviceDataException {
    return new CliData(new Reader(name).read(text));
  }

  public String name() {
    return name;
  }

  /** The commands of a mode in file order; the routing modes 13 to 15 share those of 10. */
  public List<Command> commands(int mode) {
    return commands.getOrDefault(sharedMode(mode), List.of());
  }

  /** The help a file gives a keyword path (lower-case words joined by one space) in a mode; null for none. */
  public String help(int mode, String path) {
    return help.getOrDefault(sharedMode(mode), Map.of()).get(path);
  }

  public List<String> interfaceTypes() {
    return interfaceTypes;
  }

  public List<AddedMode> addedModes() {
    return addedModes;
  }

  /** The configuration lines the devices start from, as the file gives them. */
  public List<String> configuration() {
    return configuration;
  }

  /** What follows the device name in the prompt of a mode; "#" for a mode nobody knows. */
  public String promptSuffix(int mode) {
    String builtIn = BUILT_IN_SUFFIXES.get(sharedMode(mode));
    if (builtIn != null) {
      return builtIn;
    }
    return addedModes.stream().filter(added -> added.number() == mode).map(AddedMode::suffix).findFirst().orElse("#");
  }

  /** The lines of the engine's mode file for the added modes: {@code name=number}. */
  public String modesFile() {
    StringBuilder text = new StringBuilder();
    addedModes.forEach(mode -> text.append(mode.name()).append('=').append(mode.number()).append('\n'));
    return text.toString();
  }

  /** The lines of the engine's prompt file, in the order of the mode file: {@code name=suffix;}. */
  public String promptsFile() {
    StringBuilder text = new StringBuilder();
    addedModes.forEach(mode -> text.append(mode.name()).append('=').append(mode.suffix()).append(";\n"));
    return text.toString();
  }

  private static int sharedMode(int mode) {
    return mode >= 13 && mode <= LAST_BUILT_IN ? ROUTER : mode;
  }

  /** Reads one file: the section being filled and the command last read, faults thrown with their line. */
  private static final class Reader {
    private final String name;
    private final Map<Integer, List<Command>> commands = new HashMap<>();
    private final Map<Integer, Map<String, String>> help = new HashMap<>();
    private final List<String> interfaceTypes = new ArrayList<>();
    private final Map<String, AddedMode> addedModes = new LinkedHashMap<>();
    private final List<String> configuration = new ArrayList<>();
    private final Map<Integer, Map<String, Integer>> patterns = new HashMap<>();
    /** The modes of the open section; null before the first, empty in the configuration section. */
    private List<Integer> section;
    private boolean configurationSeen;
    /** The commands last read, one per mode of the section, while their output may follow. */
    private final List<int[]> lastCommands = new ArrayList<>();
    /** Whether the commands last read name an action other than a mode change, so take no output. */
    private boolean lastHaveAction;

    Reader(String name) {
      this.name = name;
    }

    Reader read(String text) throws DeviceDataException {
      String[] lines = text.split("\n", -1);
      for (int i = 0; i < lines.length; i++) {
        String line = lines[i].endsWith("\r") ? lines[i].substring(0, lines[i].length() - 1) : lines[i];
        if (!line.isBlank() && !line.startsWith("#")) {
          take(line, i + 1);
        }
      }
      if (commands.isEmpty()) {
        throw fault(Math.max(1, lines.length), "the file has no command section (such as [user, enable])");
      }
      return this;
    }

    private void take(String line, int number) throws DeviceDataException {
      Matcher header = SECTION.matcher(line);
      if (header.matches()) {
        open(header.group(1), number);
      } else if (section == null) {
        directive(line.strip(), number);
      } else if (section.isEmpty()) {
        configurationLine(line, number);
      } else if (line.startsWith("|")) {
        output(line, number);
      } else if (line.startsWith("?")) {
        helpLine(line.substring(1).strip(), number);
      } else {
        command(line.strip(), number);
      }
    }

    private void directive(String line, int number) throws DeviceDataException {
      String[] words = line.split("\\s+");
      if (words[0].equals("interface-types")) {
        if (words.length == 1) {
          throw fault(number, "interface-types needs at least one name, such as GigabitEthernet");
        }
        for (int i = 1; i < words.length; i++) {
          if (!words[i].matches("[A-Za-z][A-Za-z-]*")) {
            throw fault(number, "'" + words[i] + "' is not an interface type (letters and '-')");
          }
          interfaceTypes.add(words[i]);
        }
      } else if (words[0].equals("mode")) {
        addedMode(line, number);
      } else {
        throw fault(number, "'" + line + "' before the first section: only interface-types and mode lines go there");
      }
    }

    private void addedMode(String line, int number) throws DeviceDataException {
      Matcher mode = ADDED_MODE.matcher(line);
      if (!mode.matches()) {
        throw fault(number, "a mode line reads 'mode NAME NUMBER SUFFIX', such as mode dhcp 16 (dhcp-config)#");
      }
      String modeName = mode.group(1);
      int modeNumber = Integer.parseInt(mode.group(2));
      if (modeNumber <= LAST_BUILT_IN) {
        throw fault(number, "mode " + modeName + " takes a number above " + LAST_BUILT_IN + ", not " + modeNumber);
      }
      if (BUILT_IN_MODES.containsKey(modeName) || modeName.equals(RUNNING_CONFIG) || addedModes.containsKey(modeName)
          || addedModes.values().stream().anyMatch(added -> added.number() == modeNumber)) {
        throw fault(number, "a second mode named " + modeName + " or numbered " + modeNumber);
      }
      addedModes.put(modeName, new AddedMode(modeName, modeNumber, mode.group(3)));
    }

    private void open(String names, int number) throws DeviceDataException {
      lastCommands.clear();
      if (names.strip().equals(RUNNING_CONFIG)) {
        if (configurationSeen) {
          throw fault(number, "a second [running-config] section");
        }
        configurationSeen = true;
        section = List.of();
        return;
      }
      List<Integer> modes = new ArrayList<>();
      for (String modeName : names.split(",")) {
        modes.add(mode(modeName.strip(), number));
      }
      section = modes;
    }

    private int mode(String modeName, int number) throws DeviceDataException {
      Integer builtIn = BUILT_IN_MODES.get(modeName);
      if (builtIn != null) {
        return builtIn;
      }
      AddedMode added = addedModes.get(modeName);
      if (added == null) {
        List<String> known = new ArrayList<>(List.of("user", "enable", "config", "interface", "router", "line", "vlan"));
        known.addAll(addedModes.keySet());
        throw fault(number, "unknown mode '" + modeName + "' (" + String.join(", ", known) + ")");
      }
      return added.number();
    }

    private void configurationLine(String line, int number) throws DeviceDataException {
      boolean indented = Character.isWhitespace(line.charAt(0));
      if (indented && (configuration.isEmpty() || configuration.get(configuration.size() - 1).equals("!"))) {
        throw fault(number, "an indented configuration line outside a block (a block starts with a line such as "
            + "interface NAME)");
      }
      configuration.add(indented ? " " + line.strip() : line.strip());
    }

    private void output(String line, int number) throws DeviceDataException {
      if (lastCommands.isEmpty()) {
        throw fault(number, "an output line without a command before it");
      }
      String text = line.startsWith("| ") ? line.substring(2) : line.substring(1);
      for (int[] last : lastCommands) {
        List<Command> list = commands.get(last[0]);
        Command command = list.get(last[1]);
        if (lastHaveAction) {
          throw fault(number, "the command on line " + command.line() + " has an action (=>) and so no output lines");
        }
        List<String> output = new ArrayList<>(command.output());
        output.add(text);
        Action action = command.action() == Action.MODE ? Action.MODE : Action.OUTPUT;
        list.set(last[1], new Command(command.tokens(), command.help(), output, action, command.targetMode(),
            command.line()));
      }
    }

    private void helpLine(String line, int number) throws DeviceDataException {
      int quote = line.indexOf('"');
      if (quote <= 0 || !line.endsWith("\"") || line.length() - 1 == quote) {
        throw fault(number, "a help line reads ? WORDS \"HELP\"");
      }
      String path = String.join(" ", line.substring(0, quote).strip().toLowerCase(Locale.ROOT).split("\\s+"));
      for (int mode : section) {
        help.computeIfAbsent(mode, m -> new HashMap<>()).put(path, line.substring(quote + 1, line.length() - 1));
      }
      lastCommands.clear();
    }

    private void command(String line, int number) throws DeviceDataException {
      int open = line.indexOf('"');
      if (open < 0) {
        throw fault(number, "a command reads PATTERN \"HELP\" [-> MODE] [=> ACTION]; its help is missing");
      }
      int close = line.indexOf('"', open + 1);
      if (close < 0) {
        throw fault(number, "the help text is not closed with '\"'");
      }
      List<Token> tokens = tokens(line.substring(0, open).strip(), number);
      String helpText = line.substring(open + 1, close);
      String[] rest = line.substring(close + 1).strip().split("\\s+");
      Action action = null;
      int target = 0;
      for (int i = 0; i < rest.length && !rest[0].isEmpty(); i += 2) {
        if (i + 1 >= rest.length || !(rest[i].equals("->") || rest[i].equals("=>")) || action != null) {
          throw fault(number, "after the help comes one '-> MODE' or '=> ACTION', not '"
              + line.substring(close + 1).strip() + "'");
        }
        if (rest[i].equals("->")) {
          action = Action.MODE;
          target = mode(rest[i + 1], number);
        } else {
          action = Action.ofWord(rest[i + 1]);
          if (action == null) {
            throw fault(number, "unknown action '" + rest[i + 1] + "' (" + String.join(", ", Action.words()) + ")");
          }
        }
      }
      lastCommands.clear();
      lastHaveAction = action != null && action != Action.MODE;
      for (int mode : section) {
        Action own = action;
        if (own == null) {
          own = mode >= CONFIG ? Action.ADD : Action.SILENT;
        }
        if ((own == Action.SET || own == Action.ADD) && mode < CONFIG) {
          throw fault(number, "=> " + rest[1] + " stores a line in the configuration: it belongs to a configuration mode");
        }
        String pattern = tokens.stream().map(token -> token.text().toLowerCase(Locale.ROOT)).toList().toString();
        Integer earlier = patterns.computeIfAbsent(mode, m -> new HashMap<>()).putIfAbsent(pattern, number);
        if (earlier != null) {
          throw fault(number, "a second command '" + line.substring(0, open).strip() + "' in its mode (the first is on line "
              + earlier + ")");
        }
        List<Command> list = commands.computeIfAbsent(mode, m -> new ArrayList<>());
        list.add(new Command(tokens, helpText, List.of(), own, target, number));
        lastCommands.add(new int[] {mode, list.size() - 1});
      }
    }

    private List<Token> tokens(String pattern, int number) throws DeviceDataException {
      if (pattern.isEmpty()) {
        throw fault(number, "a command needs at least one keyword before its help");
      }
      List<Token> tokens = new ArrayList<>();
      for (String word : pattern.split("\\s+")) {
        boolean optional = word.startsWith("[");
        if (optional != word.endsWith("]") || (optional && word.length() < 3)) {
          throw fault(number, "'" + word + "': an optional token is written [TOKEN]");
        }
        String text = optional ? word.substring(1, word.length() - 1) : word;
        boolean placeholder = PLACEHOLDERS.contains(text);
        if (!placeholder && text.matches("[A-Z]+")) {
          throw fault(number, "unknown placeholder '" + text + "' (WORD, NUMBER, LINE, INTERFACE)");
        }
        if (!tokens.isEmpty() && tokens.get(tokens.size() - 1).isLine()) {
          throw fault(number, "LINE takes the rest of the line: nothing may follow it");
        }
        if (!optional && !tokens.isEmpty() && tokens.get(tokens.size() - 1).optional()) {
          throw fault(number, "'" + word + "' follows an optional token: only optional tokens may");
        }
        tokens.add(new Token(text, placeholder, optional));
      }
      if (tokens.get(0).placeholder() || tokens.get(0).optional()) {
        throw fault(number, "a command starts with a keyword, not " + tokens.get(0).text());
      }
      return tokens;
    }

    private DeviceDataException fault(int line, String reason) {
      return new DeviceDataException(name, line, reason);
    }
  }
}
