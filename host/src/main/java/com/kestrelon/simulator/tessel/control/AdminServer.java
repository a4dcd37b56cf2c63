package com.kestrelon.simulator.tessel.control;

import com.google.gson.Gson;
import com.google.gson.GsonBuilder;
import com.google.gson.JsonElement;
import com.google.gson.JsonObject;
import com.google.gson.stream.JsonReader;
import com.google.gson.stream.JsonToken;
import com.kestrelon.simulator.tessel.network.Network;
import com.sun.net.httpserver.HttpExchange;
import com.sun.net.httpserver.HttpServer;
import java.io.IOException;
import java.io.InputStream;
import java.io.OutputStream;
import java.io.StringReader;
import java.net.InetSocketAddress;
import java.net.URLDecoder;
import java.nio.ByteBuffer;
import java.nio.charset.CharacterCodingException;
import java.nio.charset.StandardCharsets;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.HashSet;
import java.util.LinkedHashMap;
import java.util.List;
import java.util.Map;
import java.util.Objects;
import java.util.Optional;
import java.util.Set;
import java.util.concurrent.ExecutorService;
import java.util.concurrent.Executors;
import java.util.concurrent.atomic.AtomicInteger;
import java.util.regex.Matcher;
import java.util.regex.Pattern;

/**
 * The control interface: the network's devices, their agents' states and the engine's statistics
 * over HTTP and JSON, the same in the Prometheus text format, and the dashboard page. Every answer
 * to a bad request is a JSON {@code {"error": reason}}; nothing a client sends stops the server.
 */
public final class AdminServer implements AutoCloseable {
  /** The largest request body read; a longer one is refused without reading the rest. */
  static final int MAX_BODY = 1 << 20;
  static final int DEFAULT_LIMIT = 100;
  static final int MAX_LIMIT = 1000;
  private static final String JSON = "application/json; charset=utf-8";
  private static final Set<String> DEVICE_QUERY = Set.of("group", "state", "offset", "limit");
  private static final Gson GSON = new GsonBuilder().disableHtmlEscaping().create();
  private static final Gson GSON_NULLS = new GsonBuilder().disableHtmlEscaping().serializeNulls().create();

  private final HttpServer server;
  private final ExecutorService executor;
  private final Network network;
  private final DeviceTable devices;
  private final EngineReports reports;
  private final AdminAccess access;
  private final Notifications notifications;
  private final Scrambling scrambling;
  private final Tl1Control tl1;
  private final CliControl cli;
  private final Optional<byte[]> dashboard;
  private final RequestRate rate = new RequestRate();
  private final RequestRate tl1Rate = new RequestRate();
  private final RequestRate cliLoginRate = new RequestRate();
  private final List<Route> routes = List.of(
      new Route("/", "GET", (exchange, path) -> dashboard()),
      new Route("/api/network", "GET", (exchange, path) -> json(200, networkJson())),
      new Route("/api/devices", "GET", (exchange, path) -> deviceList(exchange)),
      new Route("/api/devices/([^/]+)", "GET", (exchange, path) -> device(path.group(1))),
      new Route("/api/devices/([^/]+)/(stop|start|restart)", "POST",
          (exchange, path) -> change(exchange, path.group(1), path.group(2))),
      new Route("/api/devices/([^/]+)/notifications", "POST",
          (exchange, path) -> notify(exchange, path.group(1))),
      new Route("/api/devices/([^/]+)/tl1/messages", "POST",
          (exchange, path) -> tl1Messages(exchange, path.group(1))),
      new Route("/api/devices/([^/]+)/tl1/atag", "POST", (exchange, path) -> tl1Atag(exchange, path.group(1))),
      new Route("/api/devices/([^/]+)/tl1/pending", "GET", (exchange, path) -> tl1Pending(path.group(1))),
      new Route("/api/devices/([^/]+)/tl1/pending/([^/]+)", "DELETE",
          (exchange, path) -> tl1PendingAction(exchange, path.group(1), path.group(2), false)),
      new Route("/api/devices/([^/]+)/tl1/pending/([^/]+)/run", "POST",
          (exchange, path) -> tl1PendingAction(exchange, path.group(1), path.group(2), true)),
      new Route("/api/devices/([^/]+)/cli/running-config", "GET", (exchange, path) -> cliConfig(path.group(1))),
      new Route("/api/informs", "GET", (exchange, path) -> informList()),
      new Route("/api/informs/([^/]+)", "GET", (exchange, path) -> inform(path.group(1))),
      new Route("/api/scramble", "GET, PUT, DELETE", (exchange, path) -> scramble(exchange)),
      new Route("/api/stats", "GET", (exchange, path) -> json(200, statsJson())),
      new Route("/metrics", "GET", (exchange, path) -> metrics()));

  /** An answer: its status, content type, body and extra headers. */
  private record Response(int status, String contentType, byte[] body, Map<String, String> headers) {}

  /** A request refused with a status and a reason. */
  private static final class Refusal extends Exception {
    private static final long serialVersionUID = 1L;
    final transient Response response;

    Refusal(int status, String reason) {
      this(status, reason, Map.of());
    }

    Refusal(int status, String reason, Map<String, String> headers) {
      super(reason, null, false, false);
      Map<String, Object> body = new LinkedHashMap<>();
      body.put("error", reason);
      response = new Response(status, JSON, GSON.toJson(body).getBytes(StandardCharsets.UTF_8), headers);
    }
  }

  @FunctionalInterface
  private interface Handler {
    Response handle(HttpExchange exchange, Matcher path) throws Refusal, IOException;
  }

  private record Route(Pattern path, String method, Handler handler) {
    Route(String path, String method, Handler handler) {
      this(Pattern.compile(path), method, handler);
    }
  }

  /** What sends the devices' notifications, and the log of the informs sent. */
  public record Notifications(NotificationSender sender, InformLog informs) {}

  private AdminServer(HttpServer server, ExecutorService executor, Network network, DeviceTable devices,
      EngineReports reports, Notifications notifications, Scrambling scrambling, Tl1Control tl1, CliControl cli,
      AdminAccess access, Optional<byte[]> dashboard) {
    this.server = server;
    this.executor = executor;
    this.network = network;
    this.devices = devices;
    this.reports = reports;
    this.access = access;
    this.notifications = notifications;
    this.scrambling = scrambling;
    this.tl1 = tl1;
    this.cli = cli;
    this.dashboard = dashboard;
  }

  /**
   * Listens on {@code listen} and serves until closed. With a token, every request but the
   * dashboard page itself needs it.
   */
  public static AdminServer start(InetSocketAddress listen, Optional<String> token, Network network,
      DeviceTable devices, EngineReports reports, Notifications notifications, Scrambling scrambling,
      Tl1Control tl1) throws IOException {
    return start(listen, token, network, devices, reports, notifications, scrambling, tl1, CliControl.NONE);
  }

  /** The same, for a network whose CLI agents {@code cli} shows. */
  public static AdminServer start(InetSocketAddress listen, Optional<String> token, Network network,
      DeviceTable devices, EngineReports reports, Notifications notifications, Scrambling scrambling,
      Tl1Control tl1, CliControl cli) throws IOException {
    HttpServer server = HttpServer.create(listen, 0);
    // Two request threads: one slow client does not hold the others.
    AtomicInteger threads = new AtomicInteger();
    ExecutorService executor = Executors.newFixedThreadPool(2, runnable -> {
      Thread thread = new Thread(runnable, "tessel-admin-" + threads.incrementAndGet());
      thread.setDaemon(true);
      return thread;
    });
    AdminServer admin = new AdminServer(server, executor, network, devices, reports, notifications, scrambling,
        tl1, cli, new AdminAccess(listen.getAddress(), token), readDashboard());
    server.setExecutor(executor);
    server.createContext("/", admin::serve);
    server.start();
    return admin;
  }

  /** The token an admin token file holds, surrounding whitespace removed; at least 16 characters. */
  public static Optional<String> readToken(Path file) throws AdminConfigException {
    return Optional.of(AdminAccess.readToken(file));
  }

  /** Refuses a listening address other than loopback when there is no token. */
  public static void checkListen(InetSocketAddress listen, Optional<String> token) throws AdminConfigException {
    AdminAccess.checkListen(listen.getAddress(), token);
  }

  /** The address and port the server listens on (the port chosen when it was 0). */
  public InetSocketAddress address() {
    return server.getAddress();
  }

  @Override
  public void close() {
    server.stop(0);
    executor.shutdownNow();
  }

  private void serve(HttpExchange exchange) {
    try (exchange) {
      Response response;
      try {
        response = route(exchange);
      } catch (Refusal refusal) {
        response = refusal.response;
      } catch (RuntimeException e) {
        System.err.println("control interface: " + exchange.getRequestMethod() + " "
            + exchange.getRequestURI().getRawPath() + " failed: " + e);
        response = new Refusal(500, "internal error: " + e.getClass().getSimpleName()).response;
      }
      send(exchange, response);
    } catch (IOException e) {
      // The client went away; its connection is closed and nothing else is affected.
    }
  }

  private Response route(HttpExchange exchange) throws Refusal, IOException {
    String host = exchange.getRequestHeaders().getFirst("Host");
    if (!access.hostAllowed(host, exchange.getLocalAddress().getAddress())) {
      throw new Refusal(403, "the Host header must name this server: localhost or an IP address");
    }
    String method = exchange.getRequestMethod();
    // An opaque request target (such as mailto:x) has no path; it matches no route.
    String path = Objects.requireNonNullElse(exchange.getRequestURI().getRawPath(), "");
    boolean page = path.equals("/") && method.equals("GET");
    if (!page && !access.authorized(exchange.getRequestHeaders().getFirst("Authorization"))) {
      throw new Refusal(401, "this request needs the header Authorization: Bearer TOKEN",
          Map.of("WWW-Authenticate", "Bearer"));
    }
    for (Route route : routes) {
      Matcher matcher = route.path.matcher(path);
      if (matcher.matches()) {
        if (!List.of(route.method.split(", ")).contains(method)) {
          throw new Refusal(405, path + " takes " + route.method + ", not " + method,
              Map.of("Allow", route.method));
        }
        return route.handler.handle(exchange, matcher);
      }
    }
    throw new Refusal(404, "no such path: " + path);
  }

  private Response dashboard() throws Refusal {
    byte[] page = dashboard.orElseThrow(() -> new Refusal(404, "this build has no dashboard page"));
    return new Response(200, "text/html; charset=utf-8", page, Map.of());
  }

  /** A group's TL1 listeners: the raw port, and the Telnet port when there is one. */
  private static Map<String, Object> tl1Json(Network.Tl1 tl1) {
    Map<String, Object> json = new LinkedHashMap<>();
    json.put("port", tl1.port());
    tl1.telnetPort().ifPresent(port -> json.put("telnetPort", port));
    return json;
  }

  /** A group's CLI listeners: Telnet, and SSH when there is one. */
  private static Map<String, Object> cliJson(Network.Cli cli) {
    Map<String, Object> json = new LinkedHashMap<>();
    json.put("port", cli.port());
    cli.sshPort().ifPresent(port -> json.put("sshPort", port));
    return json;
  }

  private Map<String, Object> networkJson() {
    List<Map<String, Object>> groups = new ArrayList<>();
    for (Network.Group group : network.groups()) {
      Map<String, Object> protocols = new LinkedHashMap<>();
      group.snmp().ifPresent(snmp -> protocols.put("snmp", Map.of("port", snmp.port())));
      group.tl1().ifPresent(tl1 -> protocols.put("tl1", tl1Json(tl1)));
      group.cli().ifPresent(cli -> protocols.put("cli", cliJson(cli)));
      Map<String, Object> json = new LinkedHashMap<>();
      json.put("name", group.name());
      json.put("count", group.count());
      json.put("first", group.address(0));
      json.put("last", group.address(group.count() - 1));
      json.put("protocols", protocols);
      groups.add(json);
    }
    Map<String, Object> json = new LinkedHashMap<>();
    json.put("groups", groups);
    json.put("devices", devices.size());
    json.put("running", devices.running());
    return json;
  }

  private Response deviceList(HttpExchange exchange) throws Refusal {
    Map<String, String> query = query(exchange.getRequestURI().getRawQuery());
    String group = query.get("group");
    AgentState state = null;
    if (query.containsKey("state")) {
      state = AgentState.ofText(query.get("state"));
      if (state == null) {
        throw new Refusal(400, "state is running, stopped or failed, not '" + query.get("state") + "'");
      }
    }
    int offset = number(query, "offset", 0, 0, Integer.MAX_VALUE);
    int limit = number(query, "limit", DEFAULT_LIMIT, 1, MAX_LIMIT);
    DeviceTable.Page page = devices.query(group, state, offset, limit);
    Map<String, Object> json = new LinkedHashMap<>();
    json.put("total", page.total());
    json.put("devices", page.devices().stream().map(AdminServer::deviceJson).toList());
    return json(200, json);
  }

  /** The query's parameters; an empty value counts as absent. */
  private static Map<String, String> query(String raw) throws Refusal {
    Map<String, String> parameters = new LinkedHashMap<>();
    if (raw == null || raw.isEmpty()) {
      return parameters;
    }
    Set<String> seen = new HashSet<>();
    for (String pair : raw.split("&")) {
      int equals = pair.indexOf('=');
      String name = decode(equals < 0 ? pair : pair.substring(0, equals));
      String value = equals < 0 ? "" : decode(pair.substring(equals + 1));
      if (!DEVICE_QUERY.contains(name)) {
        throw new Refusal(400, "unknown query parameter '" + name + "'; known: group, state, offset, limit");
      }
      if (!seen.add(name)) {
        throw new Refusal(400, "query parameter '" + name + "' given twice");
      }
      if (!value.isEmpty()) {
        parameters.put(name, value);
      }
    }
    return parameters;
  }

  private static String decode(String text) throws Refusal {
    try {
      return URLDecoder.decode(text, StandardCharsets.UTF_8);
    } catch (IllegalArgumentException e) {
      throw new Refusal(400, "malformed query: " + e.getMessage());
    }
  }

  private static int number(Map<String, String> query, String name, int absent, int min, int max) throws Refusal {
    String text = query.get(name);
    if (text == null) {
      return absent;
    }
    long value = text.matches("[0-9]{1,10}") ? Long.parseLong(text) : -1;
    if (value >= min && value <= max) {
      return (int) value;
    }
    throw new Refusal(400, name + " takes a whole number from " + min + " to " + max + ", not '" + text + "'");
  }

  private Response device(String address) throws Refusal {
    Device device = devices.find(address).orElseThrow(() -> noDevice(address));
    return json(200, deviceJson(device));
  }

  private static void checkOrigin(HttpExchange exchange) throws Refusal {
    String headerHost = exchange.getRequestHeaders().getFirst("Host");
    if (!AdminAccess.originAllowed(exchange.getRequestHeaders().getFirst("Origin"), headerHost)) {
      throw new Refusal(403, "a page from another origin may not change devices");
    }
  }

  private Response change(HttpExchange exchange, String address, String action) throws Refusal, IOException {
    checkOrigin(exchange);
    Optional<String> protocol = protocol(exchange);
    Optional<DeviceTable.Change> change;
    try {
      change = switch (action) {
        case "stop" -> devices.stop(address, protocol);
        case "start" -> devices.start(address, protocol);
        default -> devices.restart(address, protocol);
      };
    } catch (IllegalArgumentException e) {
      throw new Refusal(400, e.getMessage());
    }
    DeviceTable.Change done = change.orElseThrow(() -> noDevice(address));
    if (done.failure().isPresent()) {
      Map<String, Object> json = new LinkedHashMap<>();
      json.put("error", done.failure().get());
      json.put("device", deviceJson(done.device()));
      return json(409, json);
    }
    return json(200, deviceJson(done.device()));
  }

  /**
   * The protocol a state-changing request names: no body, or a JSON object with at most a
   * "protocol" string. A body needs the JSON content type, so that a plain form post from another
   * site cannot change anything.
   */
  private static Optional<String> protocol(HttpExchange exchange) throws Refusal, IOException {
    byte[] body = jsonBody(exchange);
    return body.length == 0 ? Optional.empty() : protocolField(body);
  }

  /** The body, empty or of the JSON content type. */
  private static byte[] jsonBody(HttpExchange exchange) throws Refusal, IOException {
    String type = exchange.getRequestHeaders().getFirst("Content-Type");
    if (type != null && !type.split(";", 2)[0].strip().equalsIgnoreCase("application/json")) {
      throw new Refusal(415, "a request body must be application/json, not " + type);
    }
    byte[] body = body(exchange);
    if (body.length > 0 && type == null) {
      throw new Refusal(415, "a request body needs Content-Type: application/json");
    }
    return body;
  }

  /**
   * Sends a notification from a running device: a trap answers whether it left, an inform its ID
   * in the inform log. Nothing is sent when any part of the request is wrong.
   */
  private Response notify(HttpExchange exchange, String address) throws Refusal, IOException {
    checkOrigin(exchange);
    byte[] body = jsonBody(exchange);
    Notification notification;
    try {
      notification = Notification.parse(jsonObject(body, "the notification"));
    } catch (IllegalArgumentException e) {
      throw new Refusal(400, e.getMessage());
    }
    Device device = devices.find(address).orElseThrow(() -> noDevice(address));
    if (device.protocols().get("snmp") != AgentState.RUNNING) {
      throw new Refusal(422, "the device " + device.address() + " is not running its SNMP agent");
    }
    NotificationSender.Outcome outcome = notifications.sender().send(device, notification);
    if (outcome.result() != NotificationSender.Result.SENT) {
      throw new Refusal(422, outcome.result().reason());
    }
    if (!notification.inform()) {
      return json(200, Map.of("sent", true));
    }
    return json(202, Map.of("id", notifications.informs().add(device, notification, outcome.engineInformId())));
  }

  private static JsonObject jsonObject(byte[] body, String describing) throws Refusal {
    JsonElement element = jsonElement(body, "a JSON object describing " + describing);
    if (!element.isJsonObject()) {
      throw new Refusal(400, "the body must be a JSON object");
    }
    return element.getAsJsonObject();
  }

  private static JsonElement jsonElement(byte[] body, String describing) throws Refusal {
    if (body.length == 0) {
      throw new Refusal(400, "the request needs " + describing);
    }
    try (JsonReader reader = new JsonReader(new StringReader(utf8(body)))) {
      reader.setLenient(false);
      JsonElement element = GSON.getAdapter(JsonElement.class).read(reader);
      if (reader.peek() != JsonToken.END_DOCUMENT) {
        throw new Refusal(400, "malformed JSON: more after the value");
      }
      return element;
    } catch (IOException | RuntimeException e) {
      throw new Refusal(400, "malformed JSON: " + e.getMessage());
    }
  }

  /** Autonomous messages to every TL1 client of a device, queued together. */
  private Response tl1Messages(HttpExchange exchange, String address) throws Refusal, IOException {
    checkOrigin(exchange);
    JsonElement body = jsonElement(jsonBody(exchange), "a message object or an array of them");
    List<Tl1Message> messages;
    try {
      messages = Tl1Message.parseAll(body);
    } catch (IllegalArgumentException e) {
      throw new Refusal(400, e.getMessage());
    }
    int clients = tl1.sendMessages(tl1Device(address), messages);
    if (clients == 0) {
      throw new Refusal(409, "no client connected to the device " + address);
    }
    return json(200, Map.of("clients", clients));
  }

  private Response tl1Atag(HttpExchange exchange, String address) throws Refusal, IOException {
    checkOrigin(exchange);
    JsonObject body = jsonObject(jsonBody(exchange), "the ATAG");
    if (body.size() != 1 || !body.has("atag") || !body.get("atag").isJsonPrimitive()
        || !body.get("atag").getAsString().matches("[0-9]{1,9}")) {
      throw new Refusal(400, "the body is {\"atag\": N} with N a whole number from 0 to 999999999");
    }
    int atag = body.get("atag").getAsInt();
    if (!tl1.setAtag(tl1Device(address), atag)) {
      throw new Refusal(409, "no client connected to the device " + address);
    }
    return json(200, Map.of("atag", atag));
  }

  private Response tl1Pending(String address) throws Refusal {
    List<Map<String, Object>> entries = new ArrayList<>();
    for (Tl1Control.PendingCommand entry : tl1.pending(tl1Device(address))) {
      Map<String, Object> json = new LinkedHashMap<>();
      json.put("id", entry.id());
      json.put("session", entry.session());
      json.put("on", entry.on());
      json.put("date", entry.date());
      json.put("time", entry.time());
      json.put("command", entry.command());
      entries.add(json);
    }
    return new Response(200, JSON, GSON_NULLS.toJson(Map.of("pending", entries)).getBytes(StandardCharsets.UTF_8),
        Map.of());
  }

  /** Runs a waiting command now, or cancels it. */
  private Response tl1PendingAction(HttpExchange exchange, String address, String id, boolean run)
      throws Refusal, IOException {
    checkOrigin(exchange);
    if (jsonBody(exchange).length > 0) {
      throw new Refusal(400, "this request takes no body");
    }
    Device device = tl1Device(address);
    int number = id.matches("[0-9]{1,9}") ? Integer.parseInt(id) : -1;
    boolean done = number >= 0 && (run ? tl1.runPending(device, number) : tl1.cancelPending(device, number));
    if (!done) {
      throw new Refusal(404, "no pending command " + id + " on the device " + address);
    }
    Map<String, Object> json = new LinkedHashMap<>();
    json.put("id", number);
    json.put("state", run ? "ran" : "cancelled");
    return json(200, json);
  }

  /** The device, when its TL1 agent is running. */
  private Device tl1Device(String address) throws Refusal {
    Device device = devices.find(address).orElseThrow(() -> noDevice(address));
    AgentState state = device.protocols().get("tl1");
    if (state != AgentState.RUNNING) {
      throw new Refusal(422, "the device " + device.address()
          + (state == null ? " has no TL1 agent" : " is not running its TL1 agent"));
    }
    return device;
  }

  /** A device's running configuration, whether its CLI agent runs or not (it keeps its configuration). */
  private Response cliConfig(String address) throws Refusal {
    Device device = devices.find(address).orElseThrow(() -> noDevice(address));
    if (!device.protocols().containsKey("cli")) {
      throw new Refusal(422, "the device " + device.address() + " has no CLI agent");
    }
    String config = cli.runningConfig(device).orElseThrow(
        () -> new Refusal(422, "the device " + device.address() + " has no CLI configuration"));
    Map<String, Object> json = new LinkedHashMap<>();
    json.put("address", device.address());
    json.put("runningConfig", config);
    return json(200, json);
  }

  /**
   * GET shows the scrambling setting, PUT replaces it and turns scrambling on, DELETE turns it
   * off; each answers the setting then in force.
   */
  private Response scramble(HttpExchange exchange) throws Refusal, IOException {
    String method = exchange.getRequestMethod();
    if (!method.equals("GET")) {
      checkOrigin(exchange);
    }
    if (method.equals("PUT")) {
      JsonObject body = jsonObject(jsonBody(exchange), "the scrambling");
      try {
        scrambling.set(Scrambling.parse(body, address -> devices.find(address).map(Device::address)));
      } catch (IllegalArgumentException e) {
        throw new Refusal(400, e.getMessage());
      }
    } else if (method.equals("DELETE")) {
      scrambling.off();
    }
    return json(200, scrambling.current().map(Scrambling.Setting::json).orElse(Map.of("enabled", false)));
  }

  private Response informList() {
    return json(200, Map.of("informs", notifications.informs().all().stream().map(AdminServer::informJson).toList()));
  }

  private Response inform(String id) throws Refusal {
    Optional<InformLog.Entry> entry = id.matches("[0-9]{1,9}")
        ? notifications.informs().find(Integer.parseInt(id)) : Optional.empty();
    return json(200, informJson(entry.orElseThrow(() -> new Refusal(404, "no inform " + id))));
  }

  private static Map<String, Object> informJson(InformLog.Entry entry) {
    Map<String, Object> json = new LinkedHashMap<>();
    json.put("id", entry.id());
    json.put("state", entry.state().text());
    json.put("sends", entry.sends());
    json.put("device", entry.device());
    json.put("manager", entry.manager());
    return json;
  }

  private static byte[] body(HttpExchange exchange) throws Refusal, IOException {
    // A declared length over the limit is refused before any of the body is read.
    String length = exchange.getRequestHeaders().getFirst("Content-Length");
    if (length != null && length.strip().matches("[0-9]+")
        && (length.strip().length() > 9 || Long.parseLong(length.strip()) > MAX_BODY)) {
      throw new Refusal(413, "a request body may have at most " + MAX_BODY + " bytes");
    }
    try (InputStream in = exchange.getRequestBody()) {
      byte[] body = in.readNBytes(MAX_BODY + 1);
      if (body.length > MAX_BODY) {
        throw new Refusal(413, "a request body may have at most " + MAX_BODY + " bytes");
      }
      return body;
    }
  }

  private static Optional<String> protocolField(byte[] body) throws Refusal {
    try (JsonReader reader = new JsonReader(new StringReader(utf8(body)))) {
      reader.setLenient(false);
      reader.beginObject();
      Optional<String> protocol = Optional.empty();
      while (reader.hasNext()) {
        String name = reader.nextName();
        if (!name.equals("protocol") || protocol.isPresent()) {
          throw new Refusal(400, "unknown or repeated field '" + name + "'; the body may hold \"protocol\"");
        }
        if (reader.peek() != JsonToken.STRING) {
          throw new Refusal(400, "protocol takes a string such as \"snmp\"");
        }
        protocol = Optional.of(reader.nextString());
      }
      reader.endObject();
      if (reader.peek() != JsonToken.END_DOCUMENT) {
        throw new Refusal(400, "malformed JSON: more after the object");
      }
      return protocol;
    } catch (IOException | IllegalStateException e) {
      throw new Refusal(400, "malformed JSON: " + e.getMessage());
    }
  }

  private static String utf8(byte[] body) throws Refusal {
    try {
      return StandardCharsets.UTF_8.newDecoder().decode(ByteBuffer.wrap(body)).toString();
    } catch (CharacterCodingException e) {
      throw new Refusal(400, "malformed JSON: the body is not UTF-8");
    }
  }

  private Map<String, Object> statsJson() {
    long[] counters = reports.counters();
    Map<String, Object> named = new LinkedHashMap<>();
    for (int i = 0; i < EngineReports.COUNTER_NAMES.size(); i++) {
      named.put(EngineReports.COUNTER_NAMES.get(i), counters[i]);
    }
    Map<String, Object> snmp = new LinkedHashMap<>();
    snmp.put("counters", named);
    snmp.put("requestsPerSecond", Math.round(rate.sample(counters[0]) * 1000) / 1000.0);
    List<Map<String, Object>> errors = new ArrayList<>();
    for (EngineReports.RequestError error : reports.errors()) {
      Map<String, Object> json = new LinkedHashMap<>();
      json.put("manager", error.manager());
      json.put("requestId", error.requestId());
      json.put("version", error.version());
      json.put("pdu", error.pdu());
      json.put("errorStatus", error.errorStatus());
      errors.add(json);
    }
    Tl1Control.Counters tl1Counters = tl1.counters();
    Map<String, Object> tl1Json = new LinkedHashMap<>();
    tl1Json.put("sessions", tl1Counters.sessions());
    tl1Json.put("commandsPerSecond", Math.round(tl1Rate.sample(tl1Counters.commands()) * 1000) / 1000.0);
    CliControl.Counters cliCounters = cli.counters();
    Map<String, Object> cliJson = new LinkedHashMap<>();
    cliJson.put("sessions", cliCounters.sessions());
    cliJson.put("loginsPerSecond", Math.round(cliLoginRate.sample(cliCounters.logins()) * 1000) / 1000.0);
    Map<String, Object> json = new LinkedHashMap<>();
    json.put("snmp", snmp);
    json.put("tl1", tl1Json);
    json.put("cli", cliJson);
    json.put("errors", errors);
    return json;
  }

  private Response metrics() {
    long[] counters = reports.counters();
    String text = MetricsText.render(counters, rate.sample(counters[0]), tl1.counters(), cli.counters(),
        devices.counts());
    return new Response(200, MetricsText.CONTENT_TYPE, text.getBytes(StandardCharsets.UTF_8), Map.of());
  }

  private static Map<String, Object> deviceJson(Device device) {
    Map<String, String> protocols = new LinkedHashMap<>();
    device.protocols().forEach((protocol, state) -> protocols.put(protocol, state.text()));
    Map<String, Object> json = new LinkedHashMap<>();
    json.put("address", device.address());
    json.put("name", device.name());
    json.put("group", device.group());
    json.put("protocols", protocols);
    return json;
  }

  private static Refusal noDevice(String address) {
    return new Refusal(404, "no device at " + address);
  }

  private static Response json(int status, Object body) {
    return new Response(status, JSON, GSON.toJson(body).getBytes(StandardCharsets.UTF_8), Map.of());
  }

  private static void send(HttpExchange exchange, Response response) throws IOException {
    var headers = exchange.getResponseHeaders();
    headers.set("Content-Type", response.contentType());
    headers.set("Cache-Control", "no-store");
    headers.set("X-Content-Type-Options", "nosniff");
    response.headers().forEach(headers::set);
    exchange.sendResponseHeaders(response.status(), response.body().length == 0 ? -1 : response.body().length);
    try (OutputStream out = exchange.getResponseBody()) {
      out.write(response.body());
    }
  }

  private static Optional<byte[]> readDashboard() throws IOException {
    try (InputStream page = AdminServer.class.getResourceAsStream("dashboard.html")) {
      return page == null ? Optional.empty() : Optional.of(page.readAllBytes());
    }
  }
}
