package com.kestrelon.simulator.tessel.ctl;

import com.google.gson.GsonBuilder;
import com.google.gson.JsonArray;
import com.google.gson.JsonElement;
import com.google.gson.JsonObject;
import com.kestrelon.simulator.tessel.ctl.AdminClient.ApiException;
import com.kestrelon.simulator.tessel.ctl.AdminClient.UnreachableException;
import java.io.IOException;
import java.io.PrintStream;
import java.io.PrintWriter;
import java.net.URI;
import java.net.URISyntaxException;
import java.nio.charset.StandardCharsets;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.LinkedHashMap;
import java.util.LinkedHashSet;
import java.util.List;
import java.util.Locale;
import java.util.Map;
import java.util.Optional;
import java.util.Set;
import java.util.concurrent.Callable;
import picocli.CommandLine;
import picocli.CommandLine.Command;
import picocli.CommandLine.Mixin;
import picocli.CommandLine.Model.CommandSpec;
import picocli.CommandLine.Option;
import picocli.CommandLine.ParameterException;
import picocli.CommandLine.Parameters;
import picocli.CommandLine.ParentCommand;
import picocli.CommandLine.Spec;

/**
 * {@code ./tessel ctl}: the command-line client of a running network's control interface, for
 * people (aligned tables) and scripts ({@code --json}: the interface's own JSON).
 *
 * <p>Exit statuses: 0 on success, 1 when the network answered with an error (its message on the
 * error stream), 2 for a usage error, 3 when no network answers at the control address.
 */
@Command(name = "./tessel ctl",
    description = "Shows and drives a running network through its control interface.",
    subcommands = {Ctl.Devices.class, Ctl.OneDevice.class, Ctl.Stats.class, Ctl.Trap.class, Ctl.Inform.class,
        Ctl.Informs.class, Ctl.Scramble.class, Ctl.Tl1Message.class, Ctl.Tl1Atag.class, Ctl.Tl1Pending.class,
        Ctl.Tl1Run.class, Ctl.Tl1Cancel.class, Ctl.CliConfig.class})
public final class Ctl implements Runnable {
  static final int API_ERROR = 1;
  static final int UNREACHABLE = 3;
  /** The most devices the interface gives in one page. */
  static final int PAGE_LIMIT = 1000;
  private static final String DEFAULT_ADMIN = "http://127.0.0.1:8161";
  private static final Map<String, String> ACTIONS = new LinkedHashMap<>();

  static {
    ACTIONS.put("stop", "Stops the device's agents and closes their sockets.");
    ACTIONS.put("start", "Starts the device's agents that do not run.");
    ACTIONS.put("restart", "Stops, then starts, the device's agents.");
  }

  @Mixin
  private Connection connection;

  @Spec
  private CommandSpec spec;

  public static void main(String[] args) {
    System.exit(run(args, System.out, System.err));
  }

  /** Runs one command line; its exit status. */
  static int run(String[] args, PrintStream out, PrintStream err) {
    CommandLine commandLine = new CommandLine(new Ctl());
    ACTIONS.forEach((action, description) -> {
      commandLine.addSubcommand(action, new Action(action));
      commandLine.getSubcommands().get(action).getCommandSpec().usageMessage().description(description);
    });
    PrintWriter outWriter = new PrintWriter(out, true, StandardCharsets.UTF_8);
    PrintWriter errWriter = new PrintWriter(err, true, StandardCharsets.UTF_8);
    commandLine.setOut(outWriter).setErr(errWriter);
    try {
      return commandLine.execute(args);
    } finally {
      outWriter.flush();
      errWriter.flush();
    }
  }

  @Override
  public void run() {
    throw new ParameterException(spec.commandLine(),
        "Missing command: devices, device, stop, start, restart, stats, trap, inform, informs, scramble, "
            + "tl1-message, tl1-atag, tl1-pending, tl1-run, tl1-cancel or cli-config");
  }

  /**
   * Where the network is and how to show its answers. Every command takes these, before or after
   * its name; a value given after the name wins.
   */
  static final class Connection {
    @Option(names = "--admin", paramLabel = "URL",
        description = "the control interface (default " + DEFAULT_ADMIN + ")")
    String admin;

    @Option(names = "--token-file", paramLabel = "FILE",
        description = "a file holding the access token, sent as 'Authorization: Bearer'")
    Path tokenFile;

    @Option(names = "--json", description = "print the interface's JSON instead of tables")
    Boolean json;

    @Option(names = {"-h", "--help"}, usageHelp = true, description = "print this help and exit")
    boolean help;

    Connection over(Connection outer) {
      Connection merged = new Connection();
      merged.admin = admin != null ? admin : outer.admin;
      merged.tokenFile = tokenFile != null ? tokenFile : outer.tokenFile;
      merged.json = json != null ? json : outer.json;
      return merged;
    }
  }

  /** A command that asks the network: resolves the connection, maps failures to exit statuses. */
  abstract static class ApiCommand implements Callable<Integer> {
    @Mixin
    private Connection connection;

    @ParentCommand
    private Ctl parent;

    @Spec
    CommandSpec spec;

    /** The exit status of a command that succeeded; a command may report 1 for what it found. */
    int status;

    @Override
    public Integer call() {
      Connection effective = connection.over(parent.connection);
      AdminClient client = new AdminClient(baseUrl(effective.admin), token(effective.tokenFile));
      PrintWriter out = spec.commandLine().getOut();
      try {
        execute(client, Boolean.TRUE.equals(effective.json), out);
        return status;
      } catch (ApiException e) {
        spec.commandLine().getErr().println("tessel ctl: " + e.getMessage());
        return API_ERROR;
      } catch (UnreachableException e) {
        spec.commandLine().getErr().println("tessel ctl: " + e.getMessage());
        return UNREACHABLE;
      }
    }

    abstract void execute(AdminClient client, boolean json, PrintWriter out)
        throws ApiException, UnreachableException;

    private String baseUrl(String admin) {
      String text = admin == null ? DEFAULT_ADMIN : admin.contains("://") ? admin : "http://" + admin;
      try {
        URI uri = new URI(text);
        if (!Set.of("http", "https").contains(String.valueOf(uri.getScheme())) || uri.getHost() == null) {
          throw new URISyntaxException(text, "not an http URL with a host");
        }
        return text.replaceAll("/+$", "");
      } catch (URISyntaxException e) {
        throw new ParameterException(spec.commandLine(), "Invalid --admin '" + admin + "': " + e.getReason());
      }
    }

    private Optional<String> token(Path file) {
      if (file == null) {
        return Optional.empty();
      }
      try {
        return Optional.of(Files.readString(file, StandardCharsets.UTF_8).strip());
      } catch (IOException e) {
        throw new ParameterException(spec.commandLine(), "Cannot read --token-file " + file + ": " + e);
      }
    }
  }

  @Command(name = "devices",
      description = "Lists the devices in address order, with each protocol's state.")
  static final class Devices extends ApiCommand {
    @Option(names = "--group", paramLabel = "G", description = "only the devices of group G")
    String group;

    @Option(names = "--state", paramLabel = "S", description = "only devices with a protocol in state S: running, stopped or failed")
    String state;

    @Override
    void execute(AdminClient client, boolean json, PrintWriter out) throws ApiException, UnreachableException {
      JsonArray devices = new JsonArray();
      long total;
      do {
        JsonObject page = client.get(pagePath(devices.size())).getAsJsonObject();
        total = page.get("total").getAsLong();
        JsonArray more = page.getAsJsonArray("devices");
        devices.addAll(more);
        if (more.isEmpty()) {
          break; // the network shrank the selection while we read it
        }
      } while (devices.size() < total);
      if (json) {
        JsonObject all = new JsonObject();
        all.addProperty("total", total);
        all.add("devices", devices);
        printJson(out, all);
      } else {
        printDevices(out, devices);
      }
    }

    private String pagePath(int offset) {
      StringBuilder path = new StringBuilder("/api/devices?offset=").append(offset).append("&limit=").append(PAGE_LIMIT);
      if (group != null) {
        path.append("&group=").append(AdminClient.encode(group));
      }
      if (state != null) {
        path.append("&state=").append(AdminClient.encode(state));
      }
      return path.toString();
    }
  }

  @Command(name = "device", description = "Shows one device.")
  static final class OneDevice extends ApiCommand {
    @Parameters(paramLabel = "ADDRESS", description = "the device's IPv4 address")
    String address;

    @Override
    void execute(AdminClient client, boolean json, PrintWriter out) throws ApiException, UnreachableException {
      showDevice(out, json, client.get("/api/devices/" + AdminClient.encode(address)));
    }
  }

  /** stop, start or restart: the device's agents, of every protocol or of one. */
  @Command
  static final class Action extends ApiCommand {
    private final String action;

    @Parameters(paramLabel = "ADDRESS", description = "the device's IPv4 address")
    String address;

    @Option(names = "--protocol", paramLabel = "P", description = "only the agent of protocol P (such as snmp)")
    String protocol;

    Action(String action) {
      this.action = action;
    }

    @Override
    void execute(AdminClient client, boolean json, PrintWriter out) throws ApiException, UnreachableException {
      Optional<JsonObject> body = Optional.ofNullable(protocol).map(name -> {
        JsonObject object = new JsonObject();
        object.addProperty("protocol", name);
        return object;
      });
      showDevice(out, json, client.post("/api/devices/" + AdminClient.encode(address) + "/" + action, body));
    }
  }

  @Command(name = "stats",
      description = "Shows the request counters that are not zero, requests per second and the recent request errors.")
  static final class Stats extends ApiCommand {
    @Override
    void execute(AdminClient client, boolean json, PrintWriter out) throws ApiException, UnreachableException {
      JsonObject stats = client.get("/api/stats").getAsJsonObject();
      if (json) {
        printJson(out, stats);
        return;
      }
      for (Map.Entry<String, JsonElement> protocol : stats.entrySet()) {
        if (protocol.getValue().isJsonObject() && protocol.getValue().getAsJsonObject().has("counters")) {
          printProtocolStats(out, protocol.getKey(), protocol.getValue().getAsJsonObject());
        }
      }
      if (stats.has("tl1")) {
        JsonObject tl1 = stats.getAsJsonObject("tl1");
        out.println("tl1 sessions: " + tl1.get("sessions").getAsString() + ", commands per second: "
            + tl1.get("commandsPerSecond").getAsString());
      }
      if (stats.has("cli")) {
        JsonObject cli = stats.getAsJsonObject("cli");
        out.println("cli sessions: " + cli.get("sessions").getAsString() + ", logins per second: "
            + cli.get("loginsPerSecond").getAsString());
      }
      JsonArray errors = stats.has("errors") ? stats.getAsJsonArray("errors") : new JsonArray();
      out.println();
      out.println("recent request errors: " + errors.size());
      if (!errors.isEmpty()) {
        printObjects(out, errors);
      }
    }

    private static void printProtocolStats(PrintWriter out, String protocol, JsonObject stats) {
      JsonElement rate = stats.get("requestsPerSecond");
      out.println(protocol + " requests per second: " + (rate == null ? "-" : rate.getAsString()));
      TextTable table = new TextTable(List.of("COUNTER", "VALUE"));
      for (Map.Entry<String, JsonElement> counter : stats.getAsJsonObject("counters").entrySet()) {
        if (!counter.getValue().getAsString().equals("0")) {
          table.row(List.of(counter.getKey(), counter.getValue().getAsString()));
        }
      }
      table.print(out);
    }
  }

  /**
   * trap and inform: a notification from the device at ADDRESS to the manager of --to, built from
   * the trap OID and OID TYPE VALUE triples (TYPE as net-snmp's snmptrap: i u c C s x d n o t a b);
   * an SNMPv1 trap takes --enterprise, --generic and --specific instead of the trap OID.
   */
  abstract static class NotificationCommand extends ApiCommand {
    @Parameters(index = "0", paramLabel = "ADDRESS", description = "the device's IPv4 address")
    String address;

    @Parameters(index = "1..*", paramLabel = "TRAPOID [OID TYPE VALUE]...",
        description = "the trap's OID (not for v1), then a binding per OID TYPE VALUE")
    List<String> rest = new ArrayList<>();

    @Option(names = "--to", required = true, paramLabel = "HOST:PORT",
        description = "the manager, such as 127.0.0.1:162 or [::1]:162")
    String manager;

    @Option(names = "--version", paramLabel = "V", description = "v1, v2c (the default) or v3")
    String version = "v2c";

    @Option(names = "--community", paramLabel = "C", description = "the community (v1 and v2c; default public)")
    String community;

    @Option(names = "--user", paramLabel = "U", description = "the SNMPv3 user, sent at its own security level")
    String user;

    @Option(names = "--context", paramLabel = "X", description = "the SNMPv3 context (default empty)")
    String context;

    @Option(names = "--enterprise", paramLabel = "E", description = "v1: the enterprise OID")
    String enterprise;

    @Option(names = "--generic", paramLabel = "G", description = "v1: the generic-trap, 0 to 6 (default 6)")
    Integer generic;

    @Option(names = "--specific", paramLabel = "S", description = "v1: the specific-trap (default 0)")
    Integer specific;

    /** The request body; a usage error when the arguments cannot make one. */
    JsonObject body(String kind) {
      if (community != null && user != null) {
        throw usage("Give --community (v1, v2c) or --user (v3), not both");
      }
      if (context != null && user == null) {
        throw usage("--context goes with --user");
      }
      boolean v1 = version.equals("v1");
      if (!v1 && (enterprise != null || generic != null || specific != null)) {
        throw usage("--enterprise, --generic and --specific make an SNMPv1 trap; use --version v1");
      }
      if (v1 && enterprise == null) {
        throw usage("An SNMPv1 trap needs --enterprise E (and --generic G --specific S)");
      }
      int first = v1 ? 0 : 1;
      if (rest.size() < first || (rest.size() - first) % 3 != 0) {
        throw usage(v1 ? "After ADDRESS come bindings, each OID TYPE VALUE"
            : "After ADDRESS come the trap OID and bindings, each OID TYPE VALUE");
      }
      JsonObject body = new JsonObject();
      body.addProperty("kind", kind);
      body.addProperty("version", version);
      body.addProperty("manager", manager);
      addIfGiven(body, "community", community);
      addIfGiven(body, "user", user);
      addIfGiven(body, "context", context);
      if (v1) {
        body.addProperty("enterprise", enterprise);
        body.addProperty("generic", generic == null ? 6 : generic);
        body.addProperty("specific", specific == null ? 0 : specific);
      } else {
        body.addProperty("oid", rest.get(0));
      }
      JsonArray varbinds = new JsonArray();
      for (int i = first; i < rest.size(); i += 3) {
        JsonObject binding = new JsonObject();
        binding.addProperty("oid", rest.get(i));
        binding.addProperty("type", rest.get(i + 1));
        binding.addProperty("value", rest.get(i + 2));
        varbinds.add(binding);
      }
      body.add("varbinds", varbinds);
      return body;
    }

    JsonElement post(AdminClient client, JsonObject body) throws ApiException, UnreachableException {
      return client.post("/api/devices/" + AdminClient.encode(address) + "/notifications", Optional.of(body));
    }

    ParameterException usage(String message) {
      return new ParameterException(spec.commandLine(), message);
    }

    private static void addIfGiven(JsonObject body, String name, String value) {
      if (value != null) {
        body.addProperty(name, value);
      }
    }
  }

  @Command(name = "trap", description = "Sends a trap from the device now; prints 'sent'.")
  static final class Trap extends NotificationCommand {
    @Override
    void execute(AdminClient client, boolean json, PrintWriter out) throws ApiException, UnreachableException {
      JsonElement answer = post(client, body("trap"));
      out.println(json ? answer.toString() : "sent");
    }
  }

  @Command(name = "inform",
      description = "Sends an inform from the device now; prints its ID, or with --wait how it ended.")
  static final class Inform extends NotificationCommand {
    /** The most time --wait adds to the inform's own timeouts for its manager's discovery. */
    static final long DISCOVERY_ALLOWANCE_MILLIS = 10_000;
    private static final long POLL_MILLIS = 200;

    @Option(names = "--timeout", paramLabel = "S", description = "seconds to wait for the Response (default 5)")
    int timeout = 5;

    @Option(names = "--retries", paramLabel = "N", description = "times to send it again (default 0)")
    int retries;

    @Option(names = "--wait", description = "wait for the outcome: print 'acknowledged' (exit 0) or 'dropped' (exit 1)")
    boolean await;

    @Override
    void execute(AdminClient client, boolean json, PrintWriter out) throws ApiException, UnreachableException {
      JsonObject body = body("inform");
      body.addProperty("timeout", timeout);
      body.addProperty("retries", retries);
      int id = post(client, body).getAsJsonObject().get("id").getAsInt();
      if (!await) {
        out.println(json ? "{\"id\":" + id + "}" : String.valueOf(id));
        return;
      }
      String state = outcome(client, id);
      out.println(state);
      status = state.equals("acknowledged") ? 0 : 1;
    }

    /** Asks for the inform until it is no longer pending; bounded by its timeouts. */
    private String outcome(AdminClient client, int id) throws ApiException, UnreachableException {
      long deadline = System.nanoTime()
          + (1_000L * timeout * (retries + 1L) + DISCOVERY_ALLOWANCE_MILLIS) * 1_000_000L;
      while (true) {
        String state = client.get("/api/informs/" + id).getAsJsonObject().get("state").getAsString();
        if (!state.equals("pending")) {
          return state;
        }
        if (System.nanoTime() - deadline > 0) {
          throw new ApiException("inform " + id + " is still pending after its timeouts");
        }
        try {
          Thread.sleep(POLL_MILLIS);
        } catch (InterruptedException e) {
          Thread.currentThread().interrupt();
          throw new UnreachableException("interrupted while waiting for inform " + id);
        }
      }
    }
  }

  @Command(name = "informs", description = "Lists the informs sent through the control interface, or one of them.")
  static final class Informs extends ApiCommand {
    @Parameters(arity = "0..1", paramLabel = "ID", description = "only the inform with this ID")
    String id;

    @Override
    void execute(AdminClient client, boolean json, PrintWriter out) throws ApiException, UnreachableException {
      JsonElement answer = client.get(id == null ? "/api/informs" : "/api/informs/" + AdminClient.encode(id));
      if (json) {
        printJson(out, answer);
        return;
      }
      JsonArray informs = id == null ? answer.getAsJsonObject().getAsJsonArray("informs") : new JsonArray();
      if (id != null) {
        informs.add(answer);
      }
      printObjects(out, informs);
    }
  }

  @Command(name = "scramble",
      description = {"Has devices replace header fields of the requests they receive (--requests) and of the "
          + "replies they send (--responses): reqid, errstat, errindex, command (the PDU type), community, oid, "
          + "timeout, retries. A new setting replaces the previous one; 'scramble off' stops it, and "
          + "'scramble' alone shows it."})
  static final class Scramble extends ApiCommand {
    private static final Set<String> TEXT_KEYS = Set.of("community", "oid");

    @Parameters(arity = "0..1", paramLabel = "off", description = "stop scrambling")
    String off;

    @Option(names = "--devices", paramLabel = "A,B|all", description = "the devices that scramble (default all)")
    String devices;

    @Option(names = "--requests", paramLabel = "KEY=VALUE,...", description = "fields replaced in requests")
    String requests;

    @Option(names = "--responses", paramLabel = "KEY=VALUE,...", description = "fields replaced in replies")
    String responses;

    @Override
    void execute(AdminClient client, boolean json, PrintWriter out) throws ApiException, UnreachableException {
      boolean setting = devices != null || requests != null || responses != null;
      JsonElement answer;
      if (off != null) {
        if (!off.equals("off") || setting) {
          throw new ParameterException(spec.commandLine(), "scramble takes 'off' alone, or options, not '" + off + "'");
        }
        answer = client.delete("/api/scramble");
      } else if (setting) {
        answer = client.put("/api/scramble", body());
      } else {
        answer = client.get("/api/scramble");
      }
      if (json) {
        printJson(out, answer);
        return;
      }
      JsonObject shown = answer.getAsJsonObject();
      if (!shown.get("enabled").getAsBoolean()) {
        out.println("scrambling off");
        return;
      }
      out.println("devices    " + text(shown.get("devices")));
      out.println("requests   " + fieldsText(shown.getAsJsonObject("requests")));
      out.println("responses  " + fieldsText(shown.getAsJsonObject("responses")));
    }

    private JsonObject body() {
      JsonObject body = new JsonObject();
      if (devices != null && !devices.equals("all")) {
        JsonArray list = new JsonArray();
        for (String address : devices.split(",")) {
          list.add(address.strip());
        }
        body.add("devices", list);
      }
      if (requests != null) {
        body.add("requests", fields("--requests", requests));
      }
      if (responses != null) {
        body.add("responses", fields("--responses", responses));
      }
      return body;
    }

    /** KEY=VALUE pairs; numbers go as JSON numbers, community and oid as strings. */
    private JsonObject fields(String option, String pairs) {
      JsonObject fields = new JsonObject();
      for (String pair : pairs.split(",")) {
        int equals = pair.indexOf('=');
        if (equals <= 0) {
          throw new ParameterException(spec.commandLine(), option + " takes KEY=VALUE pairs, not '" + pair + "'");
        }
        String key = pair.substring(0, equals).strip();
        String value = pair.substring(equals + 1);
        if (!TEXT_KEYS.contains(key) && value.strip().matches("-?[0-9]{1,19}")) {
          fields.addProperty(key, Long.parseLong(value.strip()));
        } else {
          fields.addProperty(key, value);
        }
      }
      return fields;
    }

    private static String fieldsText(JsonObject fields) {
      List<String> pairs = new ArrayList<>();
      fields.entrySet().forEach(entry -> pairs.add(entry.getKey() + "=" + text(entry.getValue())));
      return pairs.isEmpty() ? "-" : String.join(",", pairs);
    }
  }

  private static void showDevice(PrintWriter out, boolean json, JsonElement device) {
    if (json) {
      printJson(out, device);
    } else {
      JsonArray one = new JsonArray();
      one.add(device);
      printDevices(out, one);
    }
  }

  /** ADDRESS NAME GROUP and one column per protocol any of the devices has ('-' where it has none). */
  /**
   * An autonomous message to every TL1 client of the device: the verb, up to two modifiers (the
   * TL1 words right after it), then the lines: {@code "text"} a quoted line, {@code /*text*}{@code /}
   * a comment, anything else a plain line.
   */
  @Command(name = "tl1-message",
      description = "Sends an autonomous message to the device's TL1 clients; prints how many it reached.")
  static final class Tl1Message extends ApiCommand {
    private static final String WORD = "[A-Za-z][A-Za-z0-9]*";

    @Parameters(index = "0", paramLabel = "ADDRESS", description = "the device's IPv4 address")
    String address;

    @Parameters(index = "1..*", arity = "1..*", paramLabel = "VERB [MOD1 [MOD2]] LINE...",
        description = "the verb, its modifiers, then the lines: \"quoted\", /*comment*/ or plain")
    List<String> words = new ArrayList<>();

    @Option(names = "--severity", required = true, paramLabel = "S",
        description = "critical, major, minor or non-alarm")
    String severity;

    @Override
    void execute(AdminClient client, boolean json, PrintWriter out) throws ApiException, UnreachableException {
      JsonObject body = new JsonObject();
      body.addProperty("severity", severity);
      body.addProperty("verb", words.get(0));
      JsonArray modifiers = new JsonArray();
      int next = 1;
      while (next < words.size() && modifiers.size() < 2 && words.get(next).matches(WORD)) {
        modifiers.add(words.get(next++));
      }
      body.add("modifiers", modifiers);
      JsonArray lines = new JsonArray();
      for (String line : words.subList(next, words.size())) {
        lines.add(line(line));
      }
      body.add("lines", lines);
      JsonElement answer = client.post(tl1Path(address, "messages"), Optional.of(body));
      out.println(json ? answer.toString() : "sent to " + answer.getAsJsonObject().get("clients").getAsString()
          + " clients");
    }

    private static JsonObject line(String text) {
      JsonObject line = new JsonObject();
      boolean quoted = text.length() >= 2 && text.startsWith("\"") && text.endsWith("\"");
      boolean comment = text.length() >= 4 && text.startsWith("/*") && text.endsWith("*/");
      line.addProperty("type", quoted ? "quoted" : comment ? "comment" : "plain");
      line.addProperty("text", quoted ? text.substring(1, text.length() - 1)
          : comment ? text.substring(2, text.length() - 2) : text);
      return line;
    }
  }

  @Command(name = "tl1-atag", description = "Sets the ATAG of the device's next autonomous message.")
  static final class Tl1Atag extends ApiCommand {
    @Parameters(index = "0", paramLabel = "ADDRESS", description = "the device's IPv4 address")
    String address;

    @Parameters(index = "1", paramLabel = "N", description = "the ATAG, 0 to 999999999")
    int atag;

    @Override
    void execute(AdminClient client, boolean json, PrintWriter out) throws ApiException, UnreachableException {
      JsonObject body = new JsonObject();
      body.addProperty("atag", atag);
      JsonElement answer = client.post(tl1Path(address, "atag"), Optional.of(body));
      out.println(json ? answer.toString() : "next ATAG " + atag);
    }
  }

  @Command(name = "tl1-pending", description = "Lists the device's TL1 commands waiting for their activation.")
  static final class Tl1Pending extends ApiCommand {
    @Parameters(paramLabel = "ADDRESS", description = "the device's IPv4 address")
    String address;

    @Override
    void execute(AdminClient client, boolean json, PrintWriter out) throws ApiException, UnreachableException {
      JsonElement answer = client.get(tl1Path(address, "pending"));
      if (json) {
        printJson(out, answer);
      } else {
        printObjects(out, answer.getAsJsonObject().getAsJsonArray("pending"));
      }
    }
  }

  /** tl1-run and tl1-cancel: one waiting command of a device, by its ID. */
  abstract static class PendingCommand extends ApiCommand {
    @Parameters(index = "0", paramLabel = "ADDRESS", description = "the device's IPv4 address")
    String address;

    @Parameters(index = "1", paramLabel = "ID", description = "the waiting command's ID (see tl1-pending)")
    int id;

    String path() {
      return tl1Path(address, "pending/" + id);
    }
  }

  @Command(name = "tl1-run", description = "Runs a waiting TL1 command now, on its session.")
  static final class Tl1Run extends PendingCommand {
    @Override
    void execute(AdminClient client, boolean json, PrintWriter out) throws ApiException, UnreachableException {
      JsonElement answer = client.post(path() + "/run", Optional.empty());
      out.println(json ? answer.toString() : "ran " + id);
    }
  }

  @Command(name = "tl1-cancel", description = "Drops a waiting TL1 command without running it.")
  static final class Tl1Cancel extends PendingCommand {
    @Override
    void execute(AdminClient client, boolean json, PrintWriter out) throws ApiException, UnreachableException {
      JsonElement answer = client.delete(path());
      out.println(json ? answer.toString() : "cancelled " + id);
    }
  }

  @Command(name = "cli-config", description = "Prints the device's running configuration, as show running-config lists it.")
  static final class CliConfig extends ApiCommand {
    @Parameters(paramLabel = "ADDRESS", description = "the device's IPv4 address")
    String address;

    @Override
    void execute(AdminClient client, boolean json, PrintWriter out) throws ApiException, UnreachableException {
      JsonElement answer = client.get("/api/devices/" + AdminClient.encode(address) + "/cli/running-config");
      if (json) {
        printJson(out, answer);
      } else {
        out.println(answer.getAsJsonObject().get("runningConfig").getAsString());
      }
    }
  }

  private static String tl1Path(String address, String rest) {
    return "/api/devices/" + AdminClient.encode(address) + "/tl1/" + rest;
  }

  private static void printDevices(PrintWriter out, JsonArray devices) {
    Set<String> protocols = new LinkedHashSet<>();
    for (JsonElement device : devices) {
      protocols.addAll(device.getAsJsonObject().getAsJsonObject("protocols").keySet());
    }
    List<String> headers = new ArrayList<>(List.of("ADDRESS", "NAME", "GROUP"));
    protocols.forEach(protocol -> headers.add(protocol.toUpperCase(Locale.ROOT)));
    TextTable table = new TextTable(headers);
    for (JsonElement element : devices) {
      JsonObject device = element.getAsJsonObject();
      JsonObject states = device.getAsJsonObject("protocols");
      List<String> row = new ArrayList<>(List.of(text(device.get("address")), text(device.get("name")),
          text(device.get("group"))));
      protocols.forEach(protocol -> row.add(text(states.get(protocol))));
      table.row(row);
    }
    table.print(out);
  }

  /** JSON objects as a table, one column per field any of them has. */
  private static void printObjects(PrintWriter out, JsonArray objects) {
    Set<String> fields = new LinkedHashSet<>();
    objects.forEach(object -> fields.addAll(object.getAsJsonObject().keySet()));
    TextTable table = new TextTable(fields.stream().map(field -> field.toUpperCase(Locale.ROOT)).toList());
    for (JsonElement object : objects) {
      table.row(fields.stream().map(field -> text(object.getAsJsonObject().get(field))).toList());
    }
    table.print(out);
  }

  private static String text(JsonElement element) {
    if (element == null || element.isJsonNull()) {
      return "-";
    }
    return element.isJsonPrimitive() ? element.getAsString() : element.toString();
  }

  private static void printJson(PrintWriter out, JsonElement json) {
    out.println(new GsonBuilder().setPrettyPrinting().create().toJson(json));
  }
}
