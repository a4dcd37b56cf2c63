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
    subcommands = {Ctl.Devices.class, Ctl.OneDevice.class, Ctl.Stats.class})
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
    throw new ParameterException(spec.commandLine(), "Missing command: devices, device, stop, start, restart or stats");
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

    @Override
    public Integer call() {
      Connection effective = connection.over(parent.connection);
      AdminClient client = new AdminClient(baseUrl(effective.admin), token(effective.tokenFile));
      PrintWriter out = spec.commandLine().getOut();
      try {
        execute(client, Boolean.TRUE.equals(effective.json), out);
        return 0;
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
