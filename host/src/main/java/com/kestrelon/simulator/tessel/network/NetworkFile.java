package com.kestrelon.simulator.tessel.network;

import com.google.gson.JsonArray;
import com.google.gson.JsonElement;
import com.google.gson.JsonObject;
import com.google.gson.JsonPrimitive;
import com.kestrelon.simulator.tessel.cli.CliData;
import com.kestrelon.simulator.tessel.control.Notification;
import com.kestrelon.simulator.tessel.data.DeviceDataException;
import com.kestrelon.simulator.tessel.data.ValueText;
import com.kestrelon.simulator.tessel.network.Network.Admin;
import com.kestrelon.simulator.tessel.network.Network.Cli;
import com.kestrelon.simulator.tessel.network.Network.Group;
import com.kestrelon.simulator.tessel.network.Network.Log;
import com.kestrelon.simulator.tessel.network.Network.Scheduled;
import com.kestrelon.simulator.tessel.network.Network.Snmp;
import com.kestrelon.simulator.tessel.network.Network.Tl1;
import com.kestrelon.simulator.tessel.network.Network.TrapSink;
import com.kestrelon.simulator.tessel.tl1.TL1Data;
import com.kestrelon.simulator.tessel.tl1.TL1User;
import java.io.IOException;
import java.io.Reader;
import java.nio.ByteBuffer;
import java.nio.file.Files;
import java.nio.file.InvalidPathException;
import java.nio.file.NoSuchFileException;
import java.nio.file.Path;
import java.time.Duration;
import java.util.ArrayList;
import java.util.LinkedHashMap;
import java.util.List;
import java.util.Map;
import java.util.Optional;
import java.util.OptionalInt;
import java.util.regex.Matcher;
import java.util.regex.Pattern;
import org.yaml.snakeyaml.Yaml;
import org.yaml.snakeyaml.error.Mark;
import org.yaml.snakeyaml.error.MarkedYAMLException;
import org.yaml.snakeyaml.error.YAMLException;
import org.yaml.snakeyaml.nodes.MappingNode;
import org.yaml.snakeyaml.nodes.Node;
import org.yaml.snakeyaml.nodes.NodeTuple;
import org.yaml.snakeyaml.nodes.ScalarNode;
import org.yaml.snakeyaml.nodes.SequenceNode;
import org.yaml.snakeyaml.nodes.Tag;

/**
 * Reads a network file (YAML) into a {@link Network}, checking all of it before anything starts:
 * every fault names the file and the line of the key it is about. Paths in the file are relative to
 * the file's folder; {@code ~} is the user's home.
 *
 * <p>The reader works on the YAML node tree rather than on constructed objects, so that every
 * value keeps its line and is taken as the text it was written as ({@code off} stays a word).
 */
public final class NetworkFile {
  private static final List<String> NETWORK_KEYS = List.of("log", "admin", "state-dir", "trap-sinks", "groups");
  private static final List<String> GROUP_KEYS =
      List.of("name", "count", "address", "device-name", "snmp", "trap-sinks", "notifications", "tl1", "cli");
  private static final List<String> SINK_KEYS =
      List.of("version", "address", "port", "community", "user", "context", "kind", "timeout", "retries");
  private static final List<String> SNMP_KEYS = List.of("port", "data", "v3", "read-community", "write-community");
  private static final List<String> TL1_KEYS =
      List.of("port", "data", "keepalive", "telnet-port", "users", "require-login");
  private static final List<String> CLI_KEYS = List.of("port", "ssh-port", "data", "user", "password", "enable");
  private static final List<String> SCHEDULED_KEYS = List.of("every", "to", "kind", "version", "oid",
      "enterprise", "generic", "specific", "varbinds", "community", "user", "context", "timeout", "retries");
  /** Keys a notification to the trap sinks takes from each sink instead. */
  private static final List<String> SINK_OWN_KEYS = List.of("community", "user", "context", "timeout", "retries");
  private static final List<String> NUMBER_KEYS = List.of("generic", "specific", "timeout", "retries");
  private static final Pattern PERIOD = Pattern.compile("([0-9]{1,9})(ms|s|m|h)");
  private static final Duration SHORTEST_PERIOD = Duration.ofMillis(100);
  private static final Duration LONGEST_PERIOD = Duration.ofDays(1);
  private static final long LAST_ADDRESS = 0xFFFF_FFFFL;

  private final String name;
  private final Path folder;
  private final List<Group> groups = new ArrayList<>();
  private final List<PortUse> ports = new ArrayList<>();
  /** TL1 data files read so far: groups that share one share what was read. */
  private final Map<Path, TL1Data> tl1Data = new LinkedHashMap<>();
  /** CLI data files read so far. */
  private final Map<Path, CliData> cliData = new LinkedHashMap<>();

  /** A port a group's devices bind on each of their addresses, and what for. */
  private record PortUse(int number, String purpose, String group) {}

  private NetworkFile(Path file) {
    name = file.toString();
    folder = file.toAbsolutePath().normalize().getParent();
  }

  /** The network {@code file} describes. */
  public static Network read(Path file) throws NetworkFileException {
    return new NetworkFile(file).network(file);
  }

  private Network network(Path file) throws NetworkFileException {
    Node root = compose(file);
    Map<String, NodeTuple> keys = mapping(root, "the network", NETWORK_KEYS);
    List<TrapSink> trapSinks = trapSinks(keys.get("trap-sinks"));
    Log log = log(keys.get("log"));
    Optional<Admin> admin =
        keys.containsKey("admin") ? admin(keys.get("admin")) : Optional.of(new Admin("127.0.0.1", 8161));
    Path stateDir = keys.containsKey("state-dir") ? path(keys.get("state-dir"))
        : Path.of(System.getProperty("user.home"), ".local", "state", "tessel");
    NodeTuple groupList = required(keys, "groups", root, "the network");
    if (!(groupList.getValueNode() instanceof SequenceNode list) || list.getValue().isEmpty()) {
      throw fault(groupList, "groups takes a list of at least one group");
    }
    for (Node group : list.getValue()) {
      groups.add(group(group));
    }
    return new Network(log, admin, stateDir, groups, trapSinks);
  }

  private Node compose(Path file) throws NetworkFileException {
    try (Reader reader = Files.newBufferedReader(file)) {
      Node root = new Yaml().compose(reader);
      if (root == null) {
        throw new NetworkFileException(name, 1, "the file is empty; a network needs at least 'groups'");
      }
      return root;
    } catch (MarkedYAMLException e) {
      Mark mark = e.getProblemMark() != null ? e.getProblemMark() : e.getContextMark();
      throw new NetworkFileException(name, mark == null ? 1 : mark.getLine() + 1, e.getProblem());
    } catch (NoSuchFileException e) {
      throw new NetworkFileException(name, 1, "no such file");
    } catch (IOException | YAMLException e) {
      throw new NetworkFileException(name, 1, "cannot be read: " + e.getMessage());
    }
  }

  private Log log(NodeTuple entry) throws NetworkFileException {
    if (entry == null) {
      return new Log(0, folder.resolve("tessel.log"));
    }
    Map<String, NodeTuple> keys = mapping(entry.getValueNode(), "log", List.of("level", "file"));
    int level = keys.containsKey("level") ? number(keys.get("level"), 0, 3) : 0;
    Path file = keys.containsKey("file") ? path(keys.get("file")) : folder.resolve("tessel.log");
    return new Log(level, file);
  }

  /** {@code admin: off}, {@code admin: {listen: off}} or {@code admin: {listen: HOST:PORT}}. */
  private Optional<Admin> admin(NodeTuple entry) throws NetworkFileException {
    NodeTuple listen = entry;
    if (!isWord(entry.getValueNode(), "off")) {
      Map<String, NodeTuple> keys = mapping(entry.getValueNode(), "admin", List.of("listen"));
      listen = required(keys, "listen", entry.getKeyNode(), "admin");
    }
    Optional<Admin> admin = Admin.parse(text(listen));
    if (admin == null) {
      throw fault(listen, "listen takes " + Admin.expected() + ", not '" + text(listen) + "'");
    }
    return admin;
  }

  private Group group(Node node) throws NetworkFileException {
    Map<String, NodeTuple> keys = mapping(node, "a group", GROUP_KEYS);
    NodeTuple nameEntry = required(keys, "name", node, "a group");
    String groupName = text(nameEntry);
    if (groups.stream().anyMatch(earlier -> earlier.name().equals(groupName))) {
      throw fault(nameEntry, "a second group named '" + groupName + "'");
    }
    int count = number(required(keys, "count", node, "a group"), 1, Integer.MAX_VALUE);
    NodeTuple addressEntry = required(keys, "address", node, "a group");
    long first = address(addressEntry);
    if (first + count - 1 > LAST_ADDRESS) {
      throw fault(addressEntry, count + " devices from " + Network.dotted(first) + " run past 255.255.255.255");
    }
    for (Group earlier : groups) {
      if (first <= earlier.lastAddress() && earlier.firstAddress() <= first + count - 1) {
        throw fault(addressEntry, "addresses " + Network.dotted(first) + " to " + Network.dotted(first + count - 1)
            + " overlap group " + earlier.name() + " (" + earlier.address(0) + " to "
            + earlier.address(earlier.count() - 1) + ")");
      }
    }
    String deviceName = keys.containsKey("device-name") ? deviceName(keys.get("device-name")) : "{address}";
    Optional<Snmp> snmp = keys.containsKey("snmp") ? Optional.of(snmp(keys.get("snmp"), groupName)) : Optional.empty();
    Optional<Tl1> tl1 = keys.containsKey("tl1") ? Optional.of(tl1(keys.get("tl1"))) : Optional.empty();
    Optional<Cli> cli = keys.containsKey("cli") ? Optional.of(cli(keys.get("cli"), tl1)) : Optional.empty();
    if (snmp.isEmpty() && tl1.isEmpty() && cli.isEmpty()) {
      throw fault(nameEntry, "group " + groupName + " has no protocol section (snmp, tl1, cli)");
    }
    return new Group(groupName, count, first, deviceName, snmp, trapSinks(keys.get("trap-sinks")),
        notifications(keys.get("notifications")), tl1, cli);
  }

  /**
   * A {@code cli} section: Telnet and SSH ports of its own (TCP, on each device's address, so they
   * must differ from each other and from the group's TL1 ports), the data (the shipped router by
   * default), the login user and the enable secret ({@code ""} for none).
   */
  private Cli cli(NodeTuple entry, Optional<Tl1> tl1) throws NetworkFileException {
    Map<String, NodeTuple> keys = mapping(entry.getValueNode(), "cli", CLI_KEYS);
    List<Integer> taken = new ArrayList<>();
    tl1.ifPresent(section -> {
      taken.add(section.port());
      section.telnetPort().ifPresent(taken::add);
    });
    int port = keys.containsKey("port") ? tcpPort(keys.get("port"), taken) : Cli.DEFAULT_PORT;
    taken.add(port);
    OptionalInt sshPort = keys.containsKey("ssh-port") ? OptionalInt.of(tcpPort(keys.get("ssh-port"), taken))
        : OptionalInt.empty();
    Path dataFile = keys.containsKey("data") ? existingFile(keys.get("data")) : defaultCliData();
    CliData data = dataFile(cliData, dataFile, CliData::load);
    String user = keys.containsKey("user") ? text(keys.get("user")) : Cli.DEFAULT_USER;
    String password = keys.containsKey("password") ? text(keys.get("password")) : Cli.DEFAULT_PASSWORD;
    String enable = keys.containsKey("enable") ? textOrEmpty(keys.get("enable")) : Cli.DEFAULT_ENABLE;
    return new Cli(port, sshPort, dataFile, data, user, password, enable,
        name + ":" + (entry.getKeyNode().getStartMark().getLine() + 1));
  }

  /** The shipped router, the data of a cli section without its own. */
  public static Path defaultCliData() {
    return Path.of(System.getProperty("tessel.profiles.dir", "profiles"), "router.cli").toAbsolutePath().normalize();
  }

  /** A TCP port none of the device's other listeners has. */
  private int tcpPort(NodeTuple entry, List<Integer> taken) throws NetworkFileException {
    int port = number(entry, 1, 65535);
    if (taken.contains(port)) {
      throw fault(entry, key(entry) + " " + port + " is another listener's port on the same device");
    }
    return port;
  }

  /**
   * A {@code tl1} section. Its ports are TCP ports bound on each device's own address, so they
   * clash with nothing of another group; the raw and the Telnet port of one device must differ.
   */
  private Tl1 tl1(NodeTuple entry) throws NetworkFileException {
    Map<String, NodeTuple> keys = mapping(entry.getValueNode(), "tl1", TL1_KEYS);
    int port = keys.containsKey("port") ? number(keys.get("port"), 1, 65535) : Tl1.DEFAULT_PORT;
    OptionalInt telnetPort = OptionalInt.empty();
    if (keys.containsKey("telnet-port")) {
      telnetPort = OptionalInt.of(number(keys.get("telnet-port"), 1, 65535));
      if (telnetPort.getAsInt() == port) {
        throw fault(keys.get("telnet-port"), "telnet-port " + port + " is the raw TL1 port too; they need two ports");
      }
    }
    int keepAlive = keys.containsKey("keepalive") ? number(keys.get("keepalive"), 0, Integer.MAX_VALUE) : 0;
    Path dataFile = existingFile(required(keys, "data", entry.getKeyNode(), "tl1"));
    TL1Data data = tl1Data(dataFile);
    List<TL1User> users = list(keys.get("users"), "users", this::user);
    for (int i = 0; i < users.size(); i++) {
      String user = users.get(i).user();
      if (users.subList(0, i).stream().anyMatch(earlier -> earlier.user().equals(user))) {
        Node item = ((SequenceNode) keys.get("users").getValueNode()).getValue().get(i);
        throw fault(item, "a second user '" + user + "'");
      }
    }
    boolean requireLogin = keys.containsKey("require-login") && flag(keys.get("require-login"));
    if (requireLogin && users.isEmpty()) {
      throw fault(keys.get("require-login"), "require-login needs users: nobody could log in");
    }
    return new Tl1(port, telnetPort, keepAlive, dataFile, data, users, requireLogin,
        name + ":" + (entry.getKeyNode().getStartMark().getLine() + 1));
  }

  /** A TL1 data file, read once however many groups use it; its faults name its own lines. */
  private TL1Data tl1Data(Path file) throws NetworkFileException {
    return dataFile(tl1Data, file, TL1Data::load);
  }

  /** Reads one kind of data file. */
  private interface DataLoader<T> {
    T load(Path file) throws DeviceDataException;
  }

  /** A data file of the kind {@code read} holds, read once; its faults name its own lines. */
  private static <T> T dataFile(Map<Path, T> read, Path file, DataLoader<T> loader) throws NetworkFileException {
    T data = read.get(file);
    if (data == null) {
      try {
        data = loader.load(file);
      } catch (DeviceDataException e) {
        throw new NetworkFileException(e.file(), e.line(), e.reason());
      }
      read.put(file, data);
    }
    return data;
  }

  private TL1User user(Node node) throws NetworkFileException {
    Map<String, NodeTuple> keys = mapping(node, "a user", List.of("user", "password"));
    return new TL1User(text(required(keys, "user", node, "a user")), text(required(keys, "password", node, "a user")));
  }

  private boolean flag(NodeTuple entry) throws NetworkFileException {
    if (isWord(entry.getValueNode(), "true") || isWord(entry.getValueNode(), "false")) {
      return isWord(entry.getValueNode(), "true");
    }
    throw fault(entry, key(entry) + " takes true or false");
  }

  /** A {@code notifications} list; none when the key is absent. */
  private List<Scheduled> notifications(NodeTuple entry) throws NetworkFileException {
    return list(entry, "notifications", this::scheduled);
  }

  /**
   * One scheduled notification: the control interface's notification (its keys, checks and
   * defaults) plus {@code every} and {@code to}, which is {@code sinks} or one manager.
   */
  private Scheduled scheduled(Node node) throws NetworkFileException {
    Map<String, NodeTuple> keys = mapping(node, "a notification", SCHEDULED_KEYS);
    Duration every = period(required(keys, "every", node, "a notification"));
    NodeTuple to = required(keys, "to", node, "a notification");
    boolean toSinks = text(to).equals("sinks");
    JsonObject json = new JsonObject();
    for (NodeTuple field : keys.values()) {
      String key = key(field);
      if (toSinks && SINK_OWN_KEYS.contains(key)) {
        throw fault(field, key + " comes from each sink when a notification goes to the sinks");
      }
      if (!key.equals("every") && !key.equals("to")) {
        json.add(key, key.equals("varbinds") ? bindingList(field) : scalar(field));
      }
    }
    if (!json.has("kind")) {
      json.addProperty("kind", "trap");
    }
    if (toSinks) {
      // The sinks give the identity, so only the form is taken from the version here.
      String form = json.has("version") && json.get("version").getAsString().equals("v1") ? "v1" : "v2c";
      json.addProperty("version", form);
      json.addProperty("manager", "127.0.0.1");
    } else {
      json.addProperty("manager", text(to));
    }
    try {
      return new Scheduled(every, toSinks, Notification.parse(json));
    } catch (IllegalArgumentException e) {
      throw fault(culprit(keys, node, e.getMessage()), e.getMessage());
    }
  }

  /** The node a notification's fault is about: the varbind or the key its reason starts with. */
  private static Node culprit(Map<String, NodeTuple> keys, Node entry, String reason) {
    Matcher varbind = Pattern.compile("varbind ([0-9]+)").matcher(reason);
    if (varbind.lookingAt() && keys.containsKey("varbinds")
        && keys.get("varbinds").getValueNode() instanceof SequenceNode list) {
      return list.getValue().get(Integer.parseInt(varbind.group(1)) - 1);
    }
    String about = reason.startsWith("manager") ? "to" : reason.split("[ :]", 2)[0];
    return keys.containsKey(about) ? keys.get(about).getKeyNode() : entry;
  }

  /** {@code 500ms}, {@code 30s}, {@code 5m} or {@code 1h}; from 100 ms to one day. */
  private Duration period(NodeTuple entry) throws NetworkFileException {
    Matcher period = PERIOD.matcher(entry.getValueNode() instanceof ScalarNode scalar ? scalar.getValue() : "");
    if (!period.matches()) {
      throw fault(entry, "every takes a period such as 500ms, 30s, 5m or 1h");
    }
    long amount = Long.parseLong(period.group(1));
    Duration every = switch (period.group(2)) {
      case "ms" -> Duration.ofMillis(amount);
      case "s" -> Duration.ofSeconds(amount);
      case "m" -> Duration.ofMinutes(amount);
      default -> Duration.ofHours(amount);
    };
    if (every.compareTo(SHORTEST_PERIOD) < 0 || every.compareTo(LONGEST_PERIOD) > 0) {
      throw fault(entry, "every takes a period from 100ms to 24h, not " + period.group());
    }
    return every;
  }

  /** A scalar as the control interface's JSON has it: counts as numbers, the rest as text. */
  private static JsonElement scalar(NodeTuple field) {
    if (!(field.getValueNode() instanceof ScalarNode scalar) || scalar.getTag().equals(Tag.NULL)) {
      return new JsonArray(); // not a text: the notification's check names the key
    }
    String text = scalar.getValue();
    return NUMBER_KEYS.contains(key(field)) && text.matches("-?[0-9]{1,18}")
        ? new JsonPrimitive(Long.parseLong(text)) : new JsonPrimitive(text);
  }

  private JsonElement bindingList(NodeTuple field) throws NetworkFileException {
    if (!(field.getValueNode() instanceof SequenceNode list)) {
      throw fault(field, "varbinds takes a list of {oid, type, value}");
    }
    JsonArray bindings = new JsonArray();
    for (Node node : list.getValue()) {
      JsonObject binding = new JsonObject();
      for (NodeTuple entry : mapping(node, "a varbind", List.of("oid", "type", "value")).values()) {
        binding.add(key(entry), scalar(entry));
      }
      bindings.add(binding);
    }
    return bindings;
  }

  /** A {@code trap-sinks} list; none when the key is absent. */
  private List<TrapSink> trapSinks(NodeTuple entry) throws NetworkFileException {
    return list(entry, "sinks", this::trapSink);
  }

  /** Reads one item of a list. */
  private interface ItemReader<T> {
    T read(Node item) throws NetworkFileException;
  }

  /** The items of the list {@code entry} holds; none when the key is absent. */
  private <T> List<T> list(NodeTuple entry, String items, ItemReader<T> reader) throws NetworkFileException {
    if (entry == null) {
      return List.of();
    }
    if (!(entry.getValueNode() instanceof SequenceNode list)) {
      throw fault(entry, key(entry) + " takes a list of " + items);
    }
    List<T> read = new ArrayList<>();
    for (Node item : list.getValue()) {
      read.add(reader.read(item));
    }
    return read;
  }

  private TrapSink trapSink(Node node) throws NetworkFileException {
    Map<String, NodeTuple> keys = mapping(node, "a trap sink", SINK_KEYS);
    NodeTuple versionEntry = required(keys, "version", node, "a trap sink");
    String version = text(versionEntry);
    if (!TrapSink.VERSIONS.contains(version)) {
      throw fault(versionEntry, "version takes v1, v2c or v3, not '" + version + "'");
    }
    String address = text(required(keys, "address", node, "a trap sink"));
    int port = keys.containsKey("port") ? number(keys.get("port"), 1, 65535) : 162;
    String kind = keys.containsKey("kind") ? text(keys.get("kind")) : "trap";
    if (!kind.equals("trap") && !kind.equals("inform")) {
      throw fault(keys.get("kind"), "kind takes trap or inform, not '" + kind + "'");
    }
    if (kind.equals("inform") && version.equals("v1")) {
      throw fault(keys.get("kind"), "SNMPv1 has no inform: a v1 sink takes kind trap");
    }
    boolean v3 = version.equals("v3");
    String credential = v3 ? "user" : "community";
    String other = v3 ? "community" : "user";
    if (keys.containsKey(other) || (!v3 && keys.containsKey("context"))) {
      NodeTuple wrong = keys.containsKey(other) ? keys.get(other) : keys.get("context");
      throw fault(wrong, "a " + version + " sink takes " + (v3 ? "user and context" : "community") + ", not "
          + key(wrong));
    }
    if (v3 && !keys.containsKey("user")) {
      throw fault(node, "a v3 sink needs 'user'");
    }
    String secret = keys.containsKey(credential) ? text(keys.get(credential)) : "public";
    String context = keys.containsKey("context") ? textOrEmpty(keys.get("context")) : "";
    int timeout = keys.containsKey("timeout") ? number(keys.get("timeout"), 1, 3600) : 5;
    int retries = keys.containsKey("retries") ? number(keys.get("retries"), 0, 100) : 0;
    return new TrapSink(version, address, port, v3 ? "" : secret, v3 ? secret : "", context,
        kind.equals("inform"), timeout, retries);
  }

  /** A text that may be empty: "" or no value (a context "" is the default context). */
  private static String textOrEmpty(NodeTuple entry) {
    return entry.getValueNode() instanceof ScalarNode scalar && !scalar.getTag().equals(Tag.NULL)
        ? scalar.getValue() : "";
  }

  private Snmp snmp(NodeTuple entry, String group) throws NetworkFileException {
    Map<String, NodeTuple> keys = mapping(entry.getValueNode(), "snmp", SNMP_KEYS);
    NodeTuple portEntry = keys.get("port");
    // The engine binds port + 1 for notifications, so the agents' port stops one short of 65535.
    int port = portEntry == null ? 1161 : number(portEntry, 1, 65534);
    claim(portEntry == null ? entry : portEntry,
        new PortUse(port, "SNMP port", group), new PortUse(port + 1, "notification port", group));
    Path data = existingFile(required(keys, "data", entry.getKeyNode(), "snmp"));
    Optional<Path> v3 = keys.containsKey("v3") ? Optional.of(existingFile(keys.get("v3"))) : Optional.empty();
    String read = keys.containsKey("read-community") ? community(keys.get("read-community")) : "public";
    String write = keys.containsKey("write-community") ? community(keys.get("write-community")) : "private";
    return new Snmp(port, data, v3, read, write);
  }

  /**
   * Groups never share an address, so they may share a port for the same purpose; a port one group
   * uses for one purpose and another for a different one would be bound twice on the same address.
   */
  private void claim(NodeTuple entry, PortUse... uses) throws NetworkFileException {
    for (PortUse use : uses) {
      for (PortUse earlier : ports) {
        if (earlier.number() == use.number() && !earlier.purpose().equals(use.purpose())) {
          throw fault(entry, use.purpose() + " " + use.number() + " clashes with the " + earlier.purpose()
              + " of group " + earlier.group() + " (the notification port is the SNMP port + 1)");
        }
      }
    }
    ports.addAll(List.of(uses));
  }

  /** The entries of a mapping by key, in file order; a key outside {@code known} is a fault. */
  private Map<String, NodeTuple> mapping(Node node, String what, List<String> known) throws NetworkFileException {
    if (!(node instanceof MappingNode map)) {
      throw fault(node, what + " takes a mapping of " + String.join(", ", known));
    }
    Map<String, NodeTuple> entries = new LinkedHashMap<>();
    for (NodeTuple entry : map.getValue()) {
      String key = entry.getKeyNode() instanceof ScalarNode scalar ? scalar.getValue() : "";
      if (!known.contains(key)) {
        throw fault(entry, "unknown key '" + key + "' in " + what + " (known: " + String.join(", ", known) + ")");
      }
      if (entries.putIfAbsent(key, entry) != null) {
        throw fault(entry, "a second '" + key + "' in " + what);
      }
    }
    return entries;
  }

  private NodeTuple required(Map<String, NodeTuple> keys, String key, Node owner, String what)
      throws NetworkFileException {
    NodeTuple entry = keys.get(key);
    if (entry == null) {
      throw fault(owner, what + " needs '" + key + "'");
    }
    return entry;
  }

  private String text(NodeTuple entry) throws NetworkFileException {
    if (entry.getValueNode() instanceof ScalarNode scalar && !scalar.getTag().equals(Tag.NULL)
        && !scalar.getValue().isEmpty()) {
      return scalar.getValue();
    }
    throw fault(entry, key(entry) + " takes a non-empty text");
  }

  private int number(NodeTuple entry, int low, int high) throws NetworkFileException {
    String text = entry.getValueNode() instanceof ScalarNode scalar ? scalar.getValue() : "";
    if (text.matches("[0-9]{1,10}") && Long.parseLong(text) >= low && Long.parseLong(text) <= high) {
      return Integer.parseInt(text);
    }
    throw fault(entry, key(entry) + " takes a whole number from " + low + " to " + high + ", not '" + text + "'");
  }

  private long address(NodeTuple entry) throws NetworkFileException {
    String text = text(entry);
    try {
      return Integer.toUnsignedLong(ByteBuffer.wrap(ValueText.parseIpAddress(text)).getInt());
    } catch (IllegalArgumentException e) {
      throw fault(entry, "address takes an IPv4 address such as 127.0.1.1, not '" + text + "'");
    }
  }

  private String deviceName(NodeTuple entry) throws NetworkFileException {
    String template = text(entry);
    String rest = template.replace("{n}", "").replace("{address}", "");
    if (rest.indexOf('{') >= 0 || rest.indexOf('}') >= 0) {
      throw fault(entry, "device-name may hold {n} and {address}, nothing else in braces: '" + template + "'");
    }
    return template;
  }

  /** The engine reads a community list split at ',', so one community cannot hold one. */
  private String community(NodeTuple entry) throws NetworkFileException {
    String community = text(entry);
    if (community.indexOf(',') >= 0) {
      throw fault(entry, key(entry) + " cannot hold ',': '" + community + "'");
    }
    return community;
  }

  private Path path(NodeTuple entry) throws NetworkFileException {
    String text = text(entry);
    try {
      if (text.equals("~") || text.startsWith("~/")) {
        return Path.of(System.getProperty("user.home") + text.substring(1)).normalize();
      }
      return folder.resolve(text).normalize();
    } catch (InvalidPathException e) {
      throw fault(entry, key(entry) + " is not a path: " + e.getReason());
    }
  }

  private Path existingFile(NodeTuple entry) throws NetworkFileException {
    Path file = path(entry);
    if (!Files.isRegularFile(file)) {
      throw fault(entry, key(entry) + " file " + file + " does not exist");
    }
    return file;
  }

  private static boolean isWord(Node node, String word) {
    return node instanceof ScalarNode scalar && scalar.getValue().equals(word);
  }

  private static String key(NodeTuple entry) {
    return ((ScalarNode) entry.getKeyNode()).getValue();
  }

  private NetworkFileException fault(NodeTuple entry, String reason) {
    return fault(entry.getKeyNode(), reason);
  }

  private NetworkFileException fault(Node node, String reason) {
    return new NetworkFileException(name, node.getStartMark().getLine() + 1, reason);
  }
}
