package com.kestrelon.simulator.tessel.ctl;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.google.gson.JsonArray;
import com.google.gson.JsonObject;
import com.google.gson.JsonParser;
import com.sun.net.httpserver.HttpExchange;
import com.sun.net.httpserver.HttpServer;
import java.io.ByteArrayOutputStream;
import java.io.IOException;
import java.io.PrintStream;
import java.net.InetSocketAddress;
import java.net.ServerSocket;
import java.net.URI;
import java.nio.charset.StandardCharsets;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.List;
import java.util.Map;
import java.util.concurrent.CopyOnWriteArrayList;
import java.util.stream.Collectors;
import java.util.stream.Stream;
import org.junit.jupiter.api.AfterEach;
import org.junit.jupiter.api.BeforeEach;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.api.io.TempDir;

/** The client against a small stand-in of the control interface on loopback. */
class CtlTest {
  private static final int DEVICES = 2500;
  private static final String TOKEN = "s3cret-token-0123456789";

  private HttpServer server;
  private String url;
  private final List<String> requests = new CopyOnWriteArrayList<>(); // "METHOD URI BEARER BODY"
  private final java.util.concurrent.atomic.AtomicInteger informPolls = new java.util.concurrent.atomic.AtomicInteger();
  private String out;
  private String err;

  @BeforeEach
  void startStandIn() throws IOException {
    server = HttpServer.create(new InetSocketAddress("127.0.0.1", 0), 0);
    server.createContext("/", this::answer);
    server.start();
    url = "http://127.0.0.1:" + server.getAddress().getPort();
  }

  @AfterEach
  void stopStandIn() {
    server.stop(0);
  }

  /** Devices 10.0.0.0 + i; the token is needed for stop only; 10.9.9.9 does not exist. */
  private void answer(HttpExchange exchange) throws IOException {
    String body = new String(exchange.getRequestBody().readAllBytes(), StandardCharsets.UTF_8);
    String bearer = String.valueOf(exchange.getRequestHeaders().getFirst("Authorization"));
    URI uri = exchange.getRequestURI();
    requests.add(exchange.getRequestMethod() + " " + uri + " " + bearer + " " + body);
    if (uri.getPath().equals("/api/devices")) {
      Map<String, String> query = Stream.of(uri.getQuery().split("&")).map(p -> p.split("=", 2))
          .collect(Collectors.toMap(p -> p[0], p -> p[1]));
      int offset = Integer.parseInt(query.get("offset"));
      int limit = Integer.parseInt(query.get("limit"));
      if (limit > 1000) {
        reply(exchange, 400, "{\"error\": \"limit above 1000\"}");
        return;
      }
      JsonArray page = new JsonArray();
      for (int i = offset; i < Math.min(DEVICES, offset + limit); i++) {
        page.add(JsonParser.parseString(device("10.0." + (i / 256) + "." + (i % 256), "running")));
      }
      JsonObject answer = new JsonObject();
      answer.addProperty("total", DEVICES);
      answer.add("devices", page);
      reply(exchange, 200, answer.toString());
    } else if (uri.getPath().equals("/api/devices/10.0.0.5/stop")) {
      boolean allowed = bearer.equals("Bearer " + TOKEN);
      reply(exchange, allowed ? 200 : 401,
          allowed ? device("10.0.0.5", "stopped") : "{\"error\": \"a valid token is needed\"}");
    } else if (uri.getPath().equals("/api/devices/10.0.0.5/notifications")) {
      boolean inform = body.contains("\"inform\"");
      reply(exchange, inform ? 202 : 200, inform ? "{\"id\": 9}" : "{\"sent\": true}");
    } else if (uri.getPath().equals("/api/informs/9")) {
      String state = informPolls.incrementAndGet() < 3 ? "pending" : "dropped";
      reply(exchange, 200, "{\"id\": 9, \"state\": \"" + state + "\", \"sends\": 1}");
    } else if (uri.getPath().equals("/api/informs")) {
      reply(exchange, 200, "{\"informs\": [{\"id\": 8, \"state\": \"acknowledged\", \"sends\": 2}]}");
    } else if (uri.getPath().equals("/api/scramble")) {
      reply(exchange, 200, exchange.getRequestMethod().equals("PUT")
          ? "{\"enabled\": true, \"devices\": [\"10.0.0.5\"], \"requests\": {}, \"responses\": {\"reqid\": 5, \"community\": \"x\"}}"
          : "{\"enabled\": false}");
    } else if (uri.getPath().startsWith("/api/devices/10.0.0.5/tl1/")) {
      String rest = uri.getPath().substring("/api/devices/10.0.0.5/tl1/".length());
      reply(exchange, 200, switch (rest) {
        case "messages" -> "{\"clients\": 2}";
        case "atag" -> "{\"atag\": 100}";
        case "pending" -> "{\"pending\": [{\"id\": 7, \"session\": 65537, \"on\": 5, \"date\": null,"
            + " \"time\": null, \"command\": \"ENT-X:NE1:A:1:ON=5;\"}]}";
        default -> "{\"id\": 7}";
      });
    } else if (uri.getPath().equals("/api/devices/10.0.0.5/cli/running-config")) {
      reply(exchange, 200, "{\"address\": \"10.0.0.5\", \"runningConfig\": \"!\\nhostname R5\\n!\\nend\"}");
    } else if (uri.getPath().equals("/api/stats")) {
      reply(exchange, 200, "{\"snmp\": {\"counters\": {\"snmpInPkts\": 12, \"snmpInBadVersions\": 0},"
          + " \"requestsPerSecond\": 3.5}, \"tl1\": {\"sessions\": 4, \"commandsPerSecond\": 1.5}, \"errors\": [{\"manager\": \"127.0.0.9\", \"errorStatus\": 2}]}");
    } else {
      reply(exchange, 404, "{\"error\": \"no device at 10.9.9.9\"}");
    }
  }

  private static String device(String address, String state) {
    return "{\"address\": \"" + address + "\", \"name\": \"R-" + address
        + "\", \"group\": \"routers\", \"protocols\": {\"snmp\": \"" + state + "\"}}";
  }

  private static void reply(HttpExchange exchange, int status, String json) throws IOException {
    byte[] bytes = json.getBytes(StandardCharsets.UTF_8);
    exchange.getResponseHeaders().set("Content-Type", "application/json");
    exchange.sendResponseHeaders(status, bytes.length);
    exchange.getResponseBody().write(bytes);
    exchange.close();
  }

  private int ctl(String... args) {
    ByteArrayOutputStream stdout = new ByteArrayOutputStream();
    ByteArrayOutputStream stderr = new ByteArrayOutputStream();
    int status = Ctl.run(args, new PrintStream(stdout, true, StandardCharsets.UTF_8),
        new PrintStream(stderr, true, StandardCharsets.UTF_8));
    out = stdout.toString(StandardCharsets.UTF_8);
    err = stderr.toString(StandardCharsets.UTF_8);
    return status;
  }

  @Test
  void devicesReadsEveryPageWithOptionsBeforeOrAfterTheCommand() {
    assertEquals(0, ctl("--json", "devices", "--admin", url));
    JsonObject all = JsonParser.parseString(out).getAsJsonObject();
    assertEquals(DEVICES, all.get("total").getAsInt());
    assertEquals(DEVICES, all.getAsJsonArray("devices").size());
    assertEquals("10.0.9.195", all.getAsJsonArray("devices").get(DEVICES - 1).getAsJsonObject().get("address").getAsString());
    assertEquals(3, requests.size(), "three pages of at most 1000");

    assertEquals(0, ctl("--admin", url, "devices", "--group", "routers"));
    List<String> lines = out.lines().toList();
    assertEquals(DEVICES + 1, lines.size());
    assertTrue(lines.get(0).matches("ADDRESS +NAME +GROUP +SNMP"), lines.get(0));
    assertTrue(lines.get(1).matches("10\\.0\\.0\\.0 +R-10\\.0\\.0\\.0 +routers +running"), lines.get(1));
    assertTrue(requests.get(3).contains("group=routers"), requests.get(3));
  }

  @Test
  void actionsSendTheTokenAndReportTheNetworksErrors(@TempDir Path directory) throws IOException {
    Path tokenFile = Files.writeString(directory.resolve("token"), "  " + TOKEN + "\n");
    assertEquals(0, ctl("stop", "10.0.0.5", "--protocol", "snmp", "--json", "--token-file", tokenFile.toString(),
        "--admin", url));
    assertEquals("stopped", JsonParser.parseString(out).getAsJsonObject().getAsJsonObject("protocols")
        .get("snmp").getAsString());
    assertEquals("POST /api/devices/10.0.0.5/stop Bearer " + TOKEN + " {\"protocol\":\"snmp\"}", requests.get(0));

    assertEquals(1, ctl("--admin", url, "stop", "10.0.0.5"));
    assertTrue(err.contains("a valid token is needed"), err);
    assertEquals(1, ctl("--admin", url, "device", "10.9.9.9"));
    assertTrue(err.contains("no device at 10.9.9.9"), err);
  }

  @Test
  void trapAndInformBuildTheNotificationFromTheirArguments() {
    assertEquals(0, ctl("--admin", url, "trap", "10.0.0.5", "--to", "[::1]:1162", "--community", "c",
        "1.3.6.1.6.3.1.1.5.3", "1.3.6.1.2.1.2.2.1.1.2", "i", "-2", "1.3.6.1.4.1.99.1", "s", "link down"));
    assertEquals("sent\n", out);
    assertEquals("POST /api/devices/10.0.0.5/notifications null {\"kind\":\"trap\",\"version\":\"v2c\","
        + "\"manager\":\"[::1]:1162\",\"community\":\"c\",\"oid\":\"1.3.6.1.6.3.1.1.5.3\",\"varbinds\":["
        + "{\"oid\":\"1.3.6.1.2.1.2.2.1.1.2\",\"type\":\"i\",\"value\":\"-2\"},"
        + "{\"oid\":\"1.3.6.1.4.1.99.1\",\"type\":\"s\",\"value\":\"link down\"}]}", requests.get(0));
    assertEquals(0, ctl("--admin", url, "trap", "10.0.0.5", "--to", "127.0.0.1:162", "--version", "v1",
        "--enterprise", "1.3.6.1.4.1.99", "--specific", "7"));
    assertTrue(requests.get(1).endsWith("\"enterprise\":\"1.3.6.1.4.1.99\",\"generic\":6,\"specific\":7,\"varbinds\":[]}"),
        requests.get(1));

    assertEquals(1, ctl("--admin", url, "inform", "10.0.0.5", "--to", "127.0.0.1:162", "--version", "v3", "--user",
        "u", "--context", "ctx", "--timeout", "1", "--wait", "1.3.6.1.4.1.99.0.1"));
    assertEquals("dropped\n", out);
    assertTrue(requests.get(2).contains("\"user\":\"u\",\"context\":\"ctx\",\"oid\":\"1.3.6.1.4.1.99.0.1\","
        + "\"varbinds\":[],\"timeout\":1,\"retries\":0}"), requests.get(2));
    assertEquals(6, requests.size(), "polled until the inform was no longer pending");
    assertEquals(0, ctl("--admin", url, "inform", "10.0.0.5", "--to", "127.0.0.1:162", "1.3.6.1.4.1.99.0.1"));
    assertEquals("9\n", out);
    assertEquals(0, ctl("--admin", url, "informs"));
    assertEquals(List.of("ID  STATE         SENDS", "8   acknowledged  2"), out.lines().toList());
  }

  @Test
  void tl1CommandsSendMessagesAtagsAndDriveWaitingCommands() {
    assertEquals(0, ctl("--admin", url, "tl1-message", "10.0.0.5", "--severity", "critical", "REPT", "ALM", "EQPT",
        "\"SLOT-1:CR,LOS\"", "/*fan*/", "plain text"));
    assertEquals("sent to 2 clients\n", out);
    assertEquals("POST /api/devices/10.0.0.5/tl1/messages null {\"severity\":\"critical\",\"verb\":\"REPT\","
        + "\"modifiers\":[\"ALM\",\"EQPT\"],\"lines\":[{\"type\":\"quoted\",\"text\":\"SLOT-1:CR,LOS\"},"
        + "{\"type\":\"comment\",\"text\":\"fan\"},{\"type\":\"plain\",\"text\":\"plain text\"}]}", requests.get(0));
    assertEquals(0, ctl("--admin", url, "tl1-message", "10.0.0.5", "--severity", "minor", "REPT", "EVT", "\"x\""));
    assertTrue(requests.get(1).contains("\"modifiers\":[\"EVT\"],\"lines\":[{\"type\":\"quoted\""), requests.get(1));
    assertEquals(0, ctl("--admin", url, "tl1-atag", "10.0.0.5", "100"));
    assertEquals("POST /api/devices/10.0.0.5/tl1/atag null {\"atag\":100}", requests.get(2));
    assertEquals(0, ctl("--admin", url, "tl1-pending", "10.0.0.5"));
    assertTrue(out.lines().anyMatch(line -> line.matches("7 +65537 +5 +.*ENT-X:NE1:A:1:ON=5;")), out);
    assertEquals(0, ctl("--admin", url, "tl1-run", "10.0.0.5", "7"));
    assertEquals(0, ctl("--admin", url, "tl1-cancel", "10.0.0.5", "7"));
    assertEquals(List.of("POST /api/devices/10.0.0.5/tl1/pending/7/run", "DELETE /api/devices/10.0.0.5/tl1/pending/7"),
        requests.subList(4, 6).stream().map(r -> r.split(" null")[0]).toList());
  }

  @Test
  void cliConfigPrintsTheConfigurationAsTheDeviceListsIt() {
    assertEquals(0, ctl("--admin", url, "cli-config", "10.0.0.5"));
    assertEquals("!\nhostname R5\n!\nend\n", out);
    assertEquals(1, ctl("--admin", url, "cli-config", "10.9.9.9"));
    assertTrue(err.contains("no device at 10.9.9.9"), err);
  }

  @Test
  void scrambleSetsShowsAndTurnsOff() {
    assertEquals(0, ctl("--admin", url, "scramble", "--devices", "10.0.0.5, 10.0.0.6", "--responses",
        "reqid=5,community=12,oid=1.3.6"));
    assertEquals("PUT /api/scramble null {\"devices\":[\"10.0.0.5\",\"10.0.0.6\"],\"responses\":"
        + "{\"reqid\":5,\"community\":\"12\",\"oid\":\"1.3.6\"}}", requests.get(0));
    assertEquals(List.of("devices    [\"10.0.0.5\"]", "requests   -", "responses  reqid=5,community=x"),
        out.lines().toList());
    assertEquals(0, ctl("--admin", url, "scramble", "--devices", "all", "--requests", "command=162"));
    assertEquals("PUT /api/scramble null {\"requests\":{\"command\":162}}", requests.get(1));
    assertEquals(0, ctl("--admin", url, "scramble", "off"));
    assertEquals("scrambling off\n", out);
    assertEquals(0, ctl("--admin", url, "scramble"));
    assertEquals(List.of("DELETE", "GET"), requests.subList(2, 4).stream().map(r -> r.split(" ")[0]).toList());
  }

  @Test
  void statsShowsNonZeroCountersRateAndErrors() {
    assertEquals(0, ctl("stats", "--admin", url));
    assertTrue(out.contains("snmp requests per second: 3.5"), out);
    assertTrue(out.contains("tl1 sessions: 4, commands per second: 1.5"), out);
    assertTrue(out.lines().anyMatch(line -> line.matches("snmpInPkts +12")), out);
    assertTrue(!out.contains("snmpInBadVersions"), out);
    assertTrue(out.lines().anyMatch(line -> line.matches("127\\.0\\.0\\.9 +2")), out);
  }

  @Test
  void usageErrorsSendNothingAndAnAbsentNetworkHasItsOwnStatus() throws IOException {
    String[][] wrong = {
        {}, {"frobnicate"}, {"stop"}, {"tl1-message", "10.0.0.5", "REPT"},
        {"scramble", "off", "--devices", "all"}, {"scramble", "--responses", "reqid"},
        {"trap", "10.0.0.5", "1.3.6.1.4.1.99.0.1"},
        {"trap", "10.0.0.5", "--to", "127.0.0.1:162"},
        {"trap", "10.0.0.5", "--to", "127.0.0.1:162", "1.3.6.1.4.1.99.0.1", "1.3.6.1.2.1.1.5.0", "s"},
        {"trap", "10.0.0.5", "--to", "127.0.0.1:162", "--version", "v1", "--generic", "2"},
        {"trap", "10.0.0.5", "--to", "127.0.0.1:162", "--enterprise", "1.3.6.1.4.1.99", "1.3.6.1.4.1.99.0.1"},
        {"trap", "10.0.0.5", "--to", "127.0.0.1:162", "--community", "c", "--user", "u", "1.3.6.1.4.1.99.0.1"},
        {"inform", "10.0.0.5", "--to", "127.0.0.1:162", "--retries", "two", "1.3.6.1.4.1.99.0.1"},
    };
    for (String[] args : wrong) {
      String[] withAdmin = Stream.concat(Stream.of("--admin", url), Stream.of(args)).toArray(String[]::new);
      assertEquals(2, ctl(withAdmin), String.join(" ", args));
    }
    assertEquals(2, ctl("--admin", "ftp://x", "stats"));
    assertEquals(List.of(), requests, "a usage error sends nothing");
    int closedPort;
    try (ServerSocket socket = new ServerSocket(0, 1, java.net.InetAddress.getLoopbackAddress())) {
      closedPort = socket.getLocalPort();
    }
    assertEquals(3, ctl("stats", "--admin", "127.0.0.1:" + closedPort));
    assertTrue(err.contains("http://127.0.0.1:" + closedPort), err);
  }
}
