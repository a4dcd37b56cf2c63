package com.kestrelon.simulator.tessel.control;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertThrows;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.google.gson.JsonObject;
import com.google.gson.JsonParser;
import com.kestrelon.simulator.tessel.network.Network;
import com.kestrelon.simulator.tessel.network.Network.Group;
import com.kestrelon.simulator.tessel.network.Network.Snmp;
import java.io.ByteArrayInputStream;
import java.io.IOException;
import java.io.InputStream;
import java.net.InetSocketAddress;
import java.net.Socket;
import java.net.URI;
import java.net.http.HttpClient;
import java.net.http.HttpRequest;
import java.net.http.HttpRequest.BodyPublishers;
import java.net.http.HttpResponse;
import java.net.http.HttpResponse.BodyHandlers;
import java.nio.charset.StandardCharsets;
import java.nio.file.Files;
import java.nio.file.Path;
import java.time.Duration;
import java.util.ArrayList;
import java.util.Collections;
import java.util.List;
import java.util.Map;
import java.util.Optional;
import java.util.OptionalInt;
import java.util.concurrent.TimeUnit;
import java.util.concurrent.atomic.AtomicLong;
import org.junit.jupiter.api.AfterEach;
import org.junit.jupiter.api.BeforeEach;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.api.io.TempDir;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.CsvSource;

/**
 * The control interface over real HTTP on loopback: a network of two groups (routers 127.0.1.1-3,
 * a second group 127.0.2.1-2 whose second device cannot open its agent) with fake agents and
 * engine reports.
 */
class AdminServerTest {
  private static final String TOKEN = "correct-horse-battery";
  private static final String REFUSING = "127.0.2.2";
  private static final String OPTICAL = "optical \"B\"";

  private final List<String> agentCalls = Collections.synchronizedList(new ArrayList<>());
  private final FakeReports reports = new FakeReports();
  private final List<String> sent = Collections.synchronizedList(new ArrayList<>());
  private volatile NotificationSender.Outcome sendOutcome = new NotificationSender.Outcome(NotificationSender.Result.SENT, 41);
  private final AtomicLong millis = new AtomicLong(1_000_000);
  private final InformLog informs = new InformLog(millis::get);
  private final HttpClient client = HttpClient.newBuilder().connectTimeout(Duration.ofSeconds(5)).build();
  private final List<Integer> engineSwitch = Collections.synchronizedList(new ArrayList<>());
  private final Scrambling scrambling = new Scrambling(engineSwitch::add);
  private final FakeTl1 tl1 = new FakeTl1();
  /** CLI agents whose configuration is the device's name, with fixed counters. */
  private final CliControl cli = new CliControl() {
    @Override
    public Optional<String> runningConfig(Device device) {
      return Optional.of("!\nhostname " + device.name() + "\nend");
    }

    @Override
    public Counters counters() {
      return new Counters(3, 12, 40);
    }
  };
  private AdminServer server;

  @TempDir
  Path dir;

  private static final class FakeReports implements EngineReports {
    final long[] counters = new long[COUNTER_NAMES.size()];
    volatile boolean broken;

    @Override
    public long[] counters() {
      return broken ? null : counters.clone();
    }

    @Override
    public List<RequestError> errors() {
      return List.of(new RequestError("127.0.0.9", 77, "v2c", "get", 2));
    }
  }

  /** TL1 agents whose device 127.0.2.1 has {@code clients} clients and one command waiting. */
  private static final class FakeTl1 implements Tl1Control {
    final List<String> calls = Collections.synchronizedList(new ArrayList<>());
    volatile int clients = 2;

    @Override
    public int sendMessages(Device device, List<Tl1Message> messages) {
      calls.add(device.address() + " " + messages.stream().map(m -> m.severity().code() + " " + m.verb() + " "
          + m.modifiers() + " " + m.lines().stream().map(l -> l.type().engineType() + ":" + l.text()).toList()).toList());
      return clients;
    }

    @Override
    public boolean setAtag(Device device, int atag) {
      calls.add(device.address() + " atag " + atag);
      return clients > 0;
    }

    @Override
    public List<PendingCommand> pending(Device device) {
      return List.of(new PendingCommand(7, 65537, 5, null, null, "ENT-X:NE1:A:1:ON=5;"));
    }

    @Override
    public boolean runPending(Device device, int id) {
      calls.add("run " + id);
      return id == 7;
    }

    @Override
    public boolean cancelPending(Device device, int id) {
      calls.add("cancel " + id);
      return id == 7;
    }

    @Override
    public Counters counters() {
      return new Counters(clients, 4_294_967_300L);
    }
  }

  private record Answer(int status, String body, HttpResponse<String> response) {
    JsonObject json() {
      return JsonParser.parseString(body).getAsJsonObject();
    }

    String header(String name) {
      return response.headers().firstValue(name).orElse("");
    }
  }

  @BeforeEach
  void start() throws IOException {
    server = start(Optional.empty());
  }

  @AfterEach
  void stop() {
    server.close();
  }

  private AdminServer start(Optional<String> token) throws IOException {
    Snmp snmp = new Snmp(1161, dir.resolve("d.snmprec"), Optional.empty(), "public", "private");
    Group routers = new Group("routers", 3, 0x7F000101L, "R{n}", Optional.of(snmp), List.of(), List.of(),
        Optional.empty(), Optional.of(new Network.Cli(2323, OptionalInt.of(2222), dir.resolve("r.cli"), null, "admin",
            "admin", "", "")));
    Group optical = new Group(OPTICAL, 2, 0x7F000201L, "O{n}", Optional.of(snmp), List.of(), List.of(),
        Optional.of(new Network.Tl1(3083, OptionalInt.of(3023), 0, dir.resolve("o.tl1"), null, List.of(), false, "")));
    Network network = new Network(new Network.Log(0, dir.resolve("log")), Optional.empty(), dir,
        List.of(routers, optical));
    DeviceTable.Builder table = new DeviceTable.Builder();
    for (Group group : network.groups()) {
      for (int i = 0; i < group.count(); i++) {
        AgentState state = group.address(i).equals(REFUSING) ? AgentState.FAILED : AgentState.RUNNING;
        Map<String, AgentState> protocols = group == optical && i == 0 ? Map.of("snmp", state, "tl1", state)
            : group == routers && i == 1 ? Map.of("snmp", state, "cli", state) : Map.of("snmp", state);
        table.add(group.firstAddress() + i, i, group.deviceName(i), group.name(), protocols);
      }
    }
    ProtocolAgents agents = new ProtocolAgents() {
      @Override
      public Optional<String> start(Device device) {
        agentCalls.add("start " + device.address());
        return device.address().equals(REFUSING) ? Optional.of("address in use") : Optional.empty();
      }

      @Override
      public void stop(Device device) {
        agentCalls.add("stop " + device.address());
      }
    };
    NotificationSender sender = (device, n) -> {
      sent.add(device.agentId() + " " + n.version().text() + " " + n.manager() + " " + n.community() + n.user()
          + " " + n.oid() + n.enterprise() + " " + n.bindings());
      return sendOutcome;
    };
    return AdminServer.start(new InetSocketAddress("127.0.0.1", 0), token, network,
        table.build(Map.of("snmp", agents, "tl1", agents, "cli", agents)), reports,
        new AdminServer.Notifications(sender, informs), scrambling, tl1, cli);
  }

  private Answer send(String method, String path, String contentType, String body, String... headers)
      throws IOException, InterruptedException {
    HttpRequest.Builder request = HttpRequest.newBuilder(URI.create(
        "http://127.0.0.1:" + server.address().getPort() + path)).timeout(Duration.ofSeconds(10));
    request.method(method, body == null ? BodyPublishers.noBody() : BodyPublishers.ofString(body));
    if (contentType != null) {
      request.header("Content-Type", contentType);
    }
    if (headers.length > 0) {
      request.headers(headers);
    }
    HttpResponse<String> response = client.send(request.build(), BodyHandlers.ofString());
    return new Answer(response.statusCode(), response.body(), response);
  }

  private Answer get(String path, String... headers) throws IOException, InterruptedException {
    return send("GET", path, null, null, headers);
  }

  /** The status line of a request written by hand, for headers the HTTP client will not send. */
  private String raw(String request) throws IOException {
    try (Socket socket = new Socket("127.0.0.1", server.address().getPort())) {
      socket.setSoTimeout(5000);
      socket.getOutputStream().write(request.getBytes(StandardCharsets.ISO_8859_1));
      InputStream in = socket.getInputStream();
      StringBuilder line = new StringBuilder();
      for (int c = in.read(); c != -1 && c != '\r'; c = in.read()) {
        line.append((char) c);
      }
      return line.toString();
    }
  }

  @Test
  void networkAndDeviceQueries() throws Exception {
    JsonObject network = get("/api/network").json();
    JsonObject routers = network.getAsJsonArray("groups").get(0).getAsJsonObject();
    assertEquals("127.0.1.1", routers.get("first").getAsString());
    assertEquals("127.0.1.3", routers.get("last").getAsString());
    assertEquals(1161, routers.getAsJsonObject("protocols").getAsJsonObject("snmp").get("port").getAsInt());
    assertEquals("{\"snmp\":{\"port\":1161},\"tl1\":{\"port\":3083,\"telnetPort\":3023}}",
        network.getAsJsonArray("groups").get(1).getAsJsonObject().get("protocols").toString());
    assertEquals(5, network.get("devices").getAsInt());
    assertEquals(4, network.get("running").getAsInt());

    JsonObject page = get("/api/devices?group=routers&offset=1&limit=1").json();
    assertEquals(3, page.get("total").getAsInt());
    assertEquals(1, page.getAsJsonArray("devices").size());
    JsonObject second = page.getAsJsonArray("devices").get(0).getAsJsonObject();
    assertEquals("127.0.1.2", second.get("address").getAsString());
    assertEquals("R2", second.get("name").getAsString());

    JsonObject failed = get("/api/devices?state=failed&group=").json();
    assertEquals(1, failed.get("total").getAsInt());
    assertEquals(REFUSING, failed.getAsJsonArray("devices").get(0).getAsJsonObject().get("address").getAsString());
    assertEquals(5, get("/api/devices").json().getAsJsonArray("devices").size());
    JsonObject device = get("/api/devices/127.0.1.3").json();
    assertEquals("R3", device.get("name").getAsString());
    assertEquals("running", device.getAsJsonObject("protocols").get("snmp").getAsString());
  }

  @ParameterizedTest(name = "{0} {1} {2} {3} -> {4}")
  @CsvSource(delimiter = '|', nullValues = "-", textBlock = """
      GET    | /api/devices?limit=1001           | -                | -                         | 400 | -
      GET    | /api/devices?limit=ten            | -                | -                         | 400 | -
      GET    | /api/devices?state=sleeping       | -                | -                         | 400 | -
      GET    | /api/devices?colour=red           | -                | -                         | 400 | -
      GET    | /api/devices?limit=5&limit=6      | -                | -                         | 400 | -
      GET    | /api/devices/10.0.0.1             | -                | -                         | 404 | -
      GET    | /nothing                          | -                | -                         | 404 | -
      DELETE | /api/network                      | -                | -                         | 405 | GET
      GET    | /api/devices/127.0.1.1/stop       | -                | -                         | 405 | POST
      POST   | /api/devices/127.0.1.1/stop       | application/json | '{"protocol": "tl1"}'     | 400 | -
      POST   | /api/devices/127.0.1.1/stop       | application/json | '{"protocl": "snmp"}'     | 400 | -
      POST   | /api/devices/127.0.1.1/stop       | application/json | '{"protocol": snmp}'      | 400 | -
      POST   | /api/devices/127.0.1.1/stop       | application/json | '{} {}'                   | 400 | -
      POST   | /api/devices/127.0.1.1/stop       | text/plain       | ''                        | 415 | -
      POST   | /api/devices/127.0.1.1/stop       | -                | '{"protocol": "snmp"}'    | 415 | -
      POST   | /api/devices/10.0.0.1/stop        | -                | -                         | 404 | -
      POST   | /api/devices/127.0.1.1/notifications | application/json | '{"kind": "trap", "manager": "127.0.0.1:162", "oid": "1.3.6.1.6.3.1.1.5.1", "varbinds": [{"oid": "1.3.6.1.2.1.1.5.0", "type": "z", "value": "x"}]}' | 400 | -
      POST   | /api/devices/127.0.1.1/notifications | application/json | '{"kind": "trap", "manager": "127.0.0.1:162", "oid": "1.3.6.1.6.3.1.1.5.1", "varbinds": [{"oid": "1.3.6.1.2.1.1.5.0", "type": "i", "value": "two"}]}' | 400 | -
      POST   | /api/devices/127.0.1.1/notifications | application/json | '{"kind": "trap", "manager": "127.0.0.1:162", "oid": "1.3.6.1.6.3.1.1.5.1", "varbinds": [{"oid": "1.3.6.1.2.1.1.3.0", "type": "t"}]}' | 400 | -
      POST   | /api/devices/127.0.1.1/notifications | application/json | '{"kind": "trap", "manager": "127.0.0.1:162", "oid": "1.3.6.1.6.3.1.1.5.1", "varbinds": [{"oid": "1.3.6.1.2.1.1.6.0", "type": "a", "value": "10.0.0.256"}]}' | 400 | -
      POST   | /api/devices/127.0.1.1/notifications | application/json | '{"kind": "trap", "version": "v1", "manager": "127.0.0.1:162", "generic": 6, "specific": 1}' | 400 | -
      POST   | /api/devices/127.0.1.1/notifications | application/json | '{"kind": "inform", "version": "v1", "manager": "127.0.0.1", "enterprise": "1.3.6.1.4.1.99"}' | 400 | -
      POST   | /api/devices/127.0.1.1/notifications | application/json | '{"kind": "trap", "manager": "127.0.0.1:162", "oid": "1.3.6.1.6.3.1.1.5.1", "colour": "red"}' | 400 | -
      POST   | /api/devices/127.0.1.1/notifications | application/json | '{"kind": "trap", "version": "v3", "manager": "127.0.0.1:162", "oid": "1.3.6.1.6.3.1.1.5.1"}' | 400 | -
      POST   | /api/devices/127.0.1.1/notifications | application/json | '{"kind": "inform", "manager": "127.0.0.1:70000", "oid": "1.3.6.1.6.3.1.1.5.1"}' | 400 | -
      POST   | /api/devices/127.0.2.2/notifications | application/json | '{"kind": "trap", "manager": "127.0.0.1:162", "oid": "1.3.6.1.6.3.1.1.5.1"}' | 422 | -
      GET    | /api/informs/7                    | -                | -                         | 404 | -
      POST   | /api/scramble                     | -                | -                         | 405 | GET, PUT, DELETE
      PUT    | /api/scramble                     | -                | -                         | 400 | -
      PUT    | /api/scramble                     | application/json | '{"devices": "all", "colour": 1}' | 400 | -
      PUT    | /api/scramble                     | application/json | '{"devices": []}'         | 400 | -
      PUT    | /api/scramble                     | application/json | '{"devices": ["10.0.0.1"]}' | 400 | -
      PUT    | /api/scramble                     | application/json | '{"requests": {"colour": 1}}' | 400 | -
      PUT    | /api/scramble                     | application/json | '{"responses": {"reqid": "five"}}' | 400 | -
      PUT    | /api/scramble                     | application/json | '{"responses": {"reqid": 2147483648}}' | 400 | -
      PUT    | /api/scramble                     | application/json | '{"responses": {"errstat": 1.5}}' | 400 | -
      PUT    | /api/scramble                     | application/json | '{"responses": {"command": 256}}' | 400 | -
      PUT    | /api/scramble                     | application/json | '{"responses": {"oid": "1.x"}}' | 400 | -
      PUT    | /api/scramble                     | application/json | '{"responses": {"community": 7}}' | 400 | -
      """)
  void refusalsAnswerJsonAndChangeNothing(String method, String path, String type, String body, int status,
      String allow) throws Exception {
    Answer answer = send(method, path, type, body);
    assertEquals(status, answer.status(), answer.body());
    assertTrue(answer.header("Content-Type").startsWith("application/json"));
    assertTrue(answer.json().get("error").getAsString().length() > 5, answer.body());
    if (allow != null) {
      assertEquals(allow, answer.header("Allow"));
    }
    assertEquals(List.of(), agentCalls);
    assertEquals(List.of(), sent);
    assertEquals(List.of(), engineSwitch);
  }

  @Test
  void scramblingIsSetReplacedShownAndTurnedOff() throws Exception {
    assertEquals("{\"enabled\":false}", get("/api/scramble").body());
    Answer on = send("PUT", "/api/scramble", "application/json", """
        {"devices": ["127.0.1.2", "127.000.001.003"], "requests": {"community": "x"},
         "responses": {"reqid": 5, "errstat": 5, "errindex": 1, "command": 162, "oid": ".1.3.6.1.4.1.99"}}""");
    assertEquals(200, on.status(), on.body());
    assertEquals("{\"enabled\":true,\"devices\":[\"127.0.1.2\",\"127.0.1.3\"],\"requests\":{\"community\":\"x\"},"
        + "\"responses\":{\"reqid\":5,\"errstat\":5,\"errindex\":1,\"command\":162,\"oid\":\".1.3.6.1.4.1.99\"}}",
        on.body());
    assertEquals(on.body(), get("/api/scramble").body());
    assertEquals(Map.of("reqid", 5, "errstat", 5, "errindex", 1, "command", (byte) 0xA2, "oid", ".1.3.6.1.4.1.99"),
        scrambling.scramble("127.0.1.3", true));
    assertEquals(Map.of("community", "x"), scrambling.scramble("127.0.1.2", false));
    assertEquals(null, scrambling.scramble("127.0.1.1", true), "a device not listed is left alone");

    // A PUT replaces the whole setting.
    assertEquals(200, send("PUT", "/api/scramble", "application/json", "{\"responses\": {\"reqid\": 9}}").status());
    assertEquals(Map.of("reqid", 9), scrambling.scramble("127.0.1.1", true));
    assertEquals(Map.of(), scrambling.scramble("127.0.1.1", false));
    assertEquals(403, send("DELETE", "/api/scramble", null, null, "Origin", "http://evil.example").status());

    Answer off = send("DELETE", "/api/scramble", null, null);
    assertEquals(200, off.status());
    assertEquals("{\"enabled\":false}", off.body());
    assertEquals(null, scrambling.scramble("127.0.1.1", true));
    assertEquals(List.of(1, 1, 0), engineSwitch);
  }

  @Test
  void notificationsAreSentWithTheirBindingsAsTheEngineTakesThem() throws Exception {
    String path = "/api/devices/127.0.1.2/notifications";
    Answer trap = send("POST", path, "application/json", """
        {"kind": "trap", "manager": "[::1]:1162", "community": "c", "oid": ".1.3.6.1.6.3.1.1.5.3",
         "varbinds": [{"oid": "1.3.6.1.2.1.2.2.1.1.2", "type": "i", "value": "2"},
                      {"oid": "1.3.6.1.4.1.99.1", "type": "s", "value": "up"},
                      {"oid": "1.3.6.1.4.1.99.2", "type": "x", "value": "0A 1b"},
                      {"oid": "1.3.6.1.4.1.99.3", "type": "b", "value": "0,9"},
                      {"oid": "1.3.6.1.4.1.99.4", "type": "C", "value": "18446744073709551615"},
                      {"oid": "1.3.6.1.4.1.99.5", "type": "o", "value": "1.3.6"}]}""");
    assertEquals(200, trap.status(), trap.body());
    assertTrue(trap.json().get("sent").getAsBoolean());
    assertEquals(List.of("1 v2c [::1]:1162 c .1.3.6.1.6.3.1.1.5.3 [Binding[oid=.1.3.6.1.2.1.2.2.1.1.2, type=2, value=2], "
        + "Binding[oid=.1.3.6.1.4.1.99.1, type=4, value='7570'h], Binding[oid=.1.3.6.1.4.1.99.2, type=4, value='0a1b'h], "
        + "Binding[oid=.1.3.6.1.4.1.99.3, type=4, value='8040'h], "
        + "Binding[oid=.1.3.6.1.4.1.99.4, type=70, value=18446744073709551615], "
        + "Binding[oid=.1.3.6.1.4.1.99.5, type=6, value=.1.3.6]]"), sent);

    sendOutcome = new NotificationSender.Outcome(NotificationSender.Result.REFUSED, 0);
    Answer refused = send("POST", path, "application/json",
        "{\"kind\": \"trap\", \"version\": \"v3\", \"user\": \"nobody\", \"manager\": \"127.0.0.1\", \"oid\": \"1.3.6.1.4.1.99.0.1\"}");
    assertEquals(422, refused.status());
    assertTrue(refused.json().get("error").getAsString().contains("notify view"), refused.body());

    sendOutcome = new NotificationSender.Outcome(NotificationSender.Result.SENT, 41);
    Answer inform = send("POST", path, "application/json", """
        {"kind": "inform", "manager": "127.0.0.1:1162", "oid": "1.3.6.1.4.1.99.0.1", "timeout": 2, "retries": 2}""");
    assertEquals(202, inform.status(), inform.body());
    String informPath = "/api/informs/" + inform.json().get("id").getAsInt();
    millis.addAndGet(2500);
    assertEquals("{\"id\":1,\"state\":\"pending\",\"sends\":2,\"device\":\"127.0.1.2\",\"manager\":\"127.0.0.1:1162\"}",
        get(informPath).body());
    informs.answered(41, 5, "127.0.1.2", "127.0.0.1", 1162, 0, 0, null, null, null);
    millis.addAndGet(60_000);
    JsonObject listed = get("/api/informs").json().getAsJsonArray("informs").get(0).getAsJsonObject();
    assertEquals("acknowledged", listed.get("state").getAsString());
    assertEquals(2, listed.get("sends").getAsInt());
  }

  @Test
  void tl1MessagesAtagsAndPendingCommandsReachTheDevicesAgent() throws Exception {
    String base = "/api/devices/127.0.2.1/tl1/";
    Answer sent = send("POST", base + "messages", "application/json", """
        [{"severity": "non-alarm", "verb": "rept", "modifiers": ["evt"], "lines": [{"type": "plain", "text": "a b"}]},
         {"severity": "critical", "verb": "REPT", "modifiers": ["ALM", "EQPT"],
          "lines": [{"type": "quoted", "text": "SLOT-1:CR,LOS"}, {"type": "comment", "text": "x"}]}]""");
    assertEquals(200, sent.status(), sent.body());
    assertEquals(2, sent.json().get("clients").getAsInt());
    assertEquals("127.0.2.1 [3 REPT [EVT] [1:a b], 0 REPT [ALM, EQPT] [0:SLOT-1:CR,LOS, 2:x]]", tl1.calls.get(0));

    String[][] refused = {
        {"{\"severity\": \"loud\", \"verb\": \"REPT\"}", "severity"},
        {"{\"severity\": \"minor\", \"verb\": \"REPT\", \"modifiers\": [\"A\", \"B\", \"C\"]}", "two modifiers"},
        {"{\"severity\": \"minor\", \"verb\": \"RE PT\"}", "TL1 word"},
        {"{\"severity\": \"minor\", \"verb\": \"REPT\", \"lines\": [{\"type\": \"quoted\", \"text\": \"a\\\"b\"}]}",
            "close it early"},
        {"{\"severity\": \"minor\", \"verb\": \"REPT\", \"lines\": [{\"type\": \"plain\", \"text\": \"a\\r\\nb\"}]}",
            "control characters"},
        {"[]", "non-empty array"}};
    for (String[] bad : refused) {
      Answer answer = send("POST", base + "messages", "application/json", bad[0]);
      assertEquals(400, answer.status(), bad[0]);
      assertTrue(answer.json().get("error").getAsString().contains(bad[1]), answer.body());
    }
    String minor = "{\"severity\": \"minor\", \"verb\": \"REPT\"}";
    assertEquals(422, send("POST", "/api/devices/127.0.1.1/tl1/messages", "application/json", minor).status());
    assertEquals(200, send("POST", base.replace("tl1/", "stop"), "application/json", "{\"protocol\": \"tl1\"}").status());
    assertEquals(422, send("POST", base + "messages", "application/json", minor).status());
    send("POST", base.replace("tl1/", "start"), null, null);
    assertEquals(1, tl1.calls.size());

    Answer atag = send("POST", base + "atag", "application/json", "{\"atag\": 100}");
    assertEquals("{\"atag\":100}", atag.body());
    assertEquals(400, send("POST", base + "atag", "application/json", "{\"atag\": -1}").status());
    tl1.clients = 0;
    Answer nobody = send("POST", base + "messages", "application/json", minor);
    assertEquals(409, nobody.status());
    assertTrue(nobody.json().get("error").getAsString().contains("no client connected"), nobody.body());
    assertEquals(409, send("POST", base + "atag", "application/json", "{\"atag\": 5}").status());

    assertEquals("{\"pending\":[{\"id\":7,\"session\":65537,\"on\":5,\"date\":null,\"time\":null,"
        + "\"command\":\"ENT-X:NE1:A:1:ON=5;\"}]}", get(base + "pending").body());
    assertEquals("{\"id\":7,\"state\":\"ran\"}", send("POST", base + "pending/7/run", null, null).body());
    assertEquals(404, send("DELETE", base + "pending/8", null, null).status());
    assertEquals(200, send("DELETE", base + "pending/7", null, null).status());
    assertEquals(List.of("run 7", "cancel 8", "cancel 7"), tl1.calls.subList(tl1.calls.size() - 3, tl1.calls.size()));

    JsonObject stats = get("/api/stats").json().getAsJsonObject("tl1");
    assertEquals(0, stats.get("sessions").getAsInt());
    assertTrue(get("/metrics").body().contains("\ntessel_tl1_commands_total 4294967300\n"));
  }

  @Test
  void cliConfigurationsAndCountersComeFromTheDevicesAgent() throws Exception {
    assertEquals("{\"address\":\"127.0.1.2\",\"runningConfig\":\"!\\nhostname R2\\nend\"}",
        get("/api/devices/127.0.1.2/cli/running-config").body());
    Answer none = get("/api/devices/127.0.1.1/cli/running-config");
    assertEquals(422, none.status());
    assertTrue(none.json().get("error").getAsString().contains("has no CLI agent"), none.body());
    assertEquals(404, get("/api/devices/127.0.9.9/cli/running-config").status());
    assertEquals("{\"port\":2323,\"sshPort\":2222}", get("/api/network").json().getAsJsonArray("groups").get(0)
        .getAsJsonObject().getAsJsonObject("protocols").get("cli").toString());
    assertEquals(3, get("/api/stats").json().getAsJsonObject("cli").get("sessions").getAsInt());
    String metrics = get("/metrics").body();
    assertTrue(metrics.contains("\ntessel_cli_sessions 3\n") && metrics.contains("\ntessel_cli_logins_total 12\n")
        && metrics.contains("\ntessel_cli_commands_total 40\n"), metrics);
  }

  @Test
  void theInformLogFollowsTheEnginesReports() {
    Device device = new Device("127.0.1.1", 0x7F000101L, 0, "R1", "routers", Map.of("snmp", AgentState.RUNNING));
    Notification v3 = Notification.parse(JsonParser.parseString("""
        {"kind": "inform", "version": "v3", "user": "u", "manager": "127.0.0.1:1162", "oid": "1.3.6.1.4.1.99.0.1",
         "timeout": 1, "retries": 3}""").getAsJsonObject());
    // A report may come before the send that caused it has returned.
    informs.answered(7, 1, "127.0.1.1", "127.0.0.1", 1162, 0, 0, null, null, null);
    int early = informs.add(device, v3, 7);
    int undiscovered = informs.add(device, v3, 8);
    int silent = informs.add(device, v3, 9);
    millis.addAndGet(40);
    informs.dropped(8, 3, "", "u", "", "127.0.0.1", 1162, null, null, null);
    millis.addAndGet(3900);
    informs.answered(8, 1, "127.0.1.1", "127.0.0.1", 1162, 0, 0, null, null, null);
    assertEquals(InformLog.State.ACKNOWLEDGED, informs.find(early).orElseThrow().state());
    assertEquals(new InformLog.Entry(undiscovered, InformLog.State.DROPPED, 0, "127.0.1.1", "127.0.0.1:1162"),
        informs.find(undiscovered).orElseThrow(), "dropped at once, and for good");
    assertEquals(InformLog.State.PENDING, informs.find(silent).orElseThrow().state());
    assertEquals(4, informs.find(silent).orElseThrow().sends(), "1 + retries at most");
    for (int i = 0; i < InformLog.KEPT; i++) {
      informs.add(device, v3, 100 + i);
    }
    assertEquals(InformLog.KEPT, informs.all().size());
    assertTrue(informs.find(silent).isEmpty());
  }

  @Test
  void stopStartAndRestartChangeTheAgents() throws Exception {
    String stop = "/api/devices/127.0.1.1/stop";
    Answer stopped = send("POST", stop, null, null);
    assertEquals(200, stopped.status());
    assertEquals("stopped", stopped.json().getAsJsonObject("protocols").get("snmp").getAsString());
    assertEquals(200, send("POST", stop, null, null).status());
    assertEquals(List.of("stop 127.0.1.1"), agentCalls);
    assertEquals(1, get("/api/devices?state=stopped").json().get("total").getAsInt());

    Answer started = send("POST", "/api/devices/127.0.1.1/start", "application/json", "{\"protocol\": \"snmp\"}");
    assertEquals("running", started.json().getAsJsonObject("protocols").get("snmp").getAsString());
    assertEquals(200, send("POST", "/api/devices/127.0.1.1/restart", "application/json; charset=utf-8", "{}").status());
    assertEquals(List.of("stop 127.0.1.1", "start 127.0.1.1", "stop 127.0.1.1", "start 127.0.1.1"), agentCalls);

    Answer refused = send("POST", "/api/devices/" + REFUSING + "/start", null, null);
    assertEquals(409, refused.status());
    assertTrue(refused.json().get("error").getAsString().contains("address in use"), refused.body());
    assertEquals("failed", refused.json().getAsJsonObject("device").getAsJsonObject("protocols")
        .get("snmp").getAsString());

    // A page of another site cannot post here, even without a body.
    assertEquals(403, send("POST", stop, null, null, "Origin", "http://evil.example").status());
    assertEquals(5, agentCalls.size());
  }

  @Test
  void oversizedBodiesAreRefusedUnread() throws Exception {
    HttpRequest chunked = HttpRequest.newBuilder(URI.create(
        "http://127.0.0.1:" + server.address().getPort() + "/api/devices/127.0.1.1/stop"))
        .header("Content-Type", "application/json")
        .POST(BodyPublishers.ofInputStream(() -> new ByteArrayInputStream(new byte[AdminServer.MAX_BODY + 1])))
        .build();
    assertEquals(413, client.send(chunked, BodyHandlers.ofString()).statusCode());
    // A declared length over the limit is answered at once, with none of the body sent.
    assertEquals("HTTP/1.1 413 Request Entity Too Large", raw("POST /api/devices/127.0.1.1/stop HTTP/1.1\r\n"
        + "Host: localhost\r\nContent-Type: application/json\r\nContent-Length: 5000000000\r\n\r\n"));
    assertEquals(List.of(), agentCalls);
  }

  @Test
  void statsAndMetricsShowTheEngineAndTheDevices() throws Exception {
    reports.counters[0] = 12;
    reports.counters[22] = 4_294_967_295L;
    JsonObject stats = get("/api/stats").json();
    JsonObject counters = stats.getAsJsonObject("snmp").getAsJsonObject("counters");
    assertEquals(28, counters.entrySet().size());
    assertEquals(12, counters.get("snmpInPkts").getAsLong());
    assertEquals(4_294_967_295L, counters.get("snmpInASNParseErrs").getAsLong());
    JsonObject error = stats.getAsJsonArray("errors").get(0).getAsJsonObject();
    assertEquals("127.0.0.9", error.get("manager").getAsString());
    assertEquals("get", error.get("pdu").getAsString());

    Answer metrics = get("/metrics");
    assertEquals("text/plain; version=0.0.4; charset=utf-8", metrics.header("Content-Type"));
    String text = metrics.body();
    assertTrue(text.contains("# TYPE tessel_snmp_in_pkts_total counter\ntessel_snmp_in_pkts_total 12\n"), text);
    assertTrue(text.contains("\ntessel_snmp_in_asn_parse_errs_total 4294967295\n"), text);
    assertTrue(text.contains("\ntessel_snmp_v2c_get_bulks_total 0\n"), text);
    assertEquals(28, text.lines().filter(line -> line.matches("# TYPE tessel_snmp_\\w+_total counter")).distinct()
        .count());
    assertTrue(text.contains("\ntessel_devices{group=\"optical \\\"B\\\"\",protocol=\"snmp\",state=\"failed\"} 1\n"),
        text);
    assertTrue(text.contains("\ntessel_devices{group=\"routers\",protocol=\"snmp\",state=\"failed\"} 0\n"), text);

    // An unexpected fault answers 500, and the server goes on.
    reports.broken = true;
    assertEquals(500, get("/metrics").status());
    reports.broken = false;
    assertEquals(200, get("/api/stats").status());
  }

  @Test
  void theRequestRateSpansTheLastTenSecondsAcrossACounterWrap() {
    AtomicLong now = new AtomicLong(TimeUnit.HOURS.toNanos(5));
    RequestRate rate = new RequestRate(now::get);
    assertEquals(0.0, rate.sample(4_294_967_290L));
    now.addAndGet(TimeUnit.SECONDS.toNanos(5));
    assertEquals(16 / 5.0, rate.sample(10), 1e-9, "16 requests, the counter wrapping through zero");
    now.addAndGet(TimeUnit.SECONDS.toNanos(15));
    assertEquals(0.0, rate.sample(10), 1e-9, "nothing arrived since the newest sample 10 s old");
    now.addAndGet(TimeUnit.SECONDS.toNanos(2));
    assertEquals(6 / 17.0, rate.sample(16), 1e-9);
  }

  @ParameterizedTest(name = "Host: {0} -> {1}")
  @CsvSource(delimiter = '|', textBlock = """
      localhost              | 200
      LocalHost:9000         | 200
      127.9.9.9:80           | 200
      [::1]:8161             | 200
      evil.example           | 403
      127.0.0.1.evil.example | 403
      [::1                   | 403
      localhost:http         | 403
      """)
  void theHostHeaderMustNameThisServer(String host, int status) throws IOException {
    String line = raw("GET /api/network HTTP/1.1\r\nHost: " + host + "\r\nConnection: close\r\n\r\n");
    assertTrue(line.startsWith("HTTP/1.1 " + status + " "), line);
  }

  @Test
  void aTokenGuardsEveryRequestButThePage() throws Exception {
    server.close();
    server = start(Optional.of(TOKEN));
    Answer without = get("/api/network");
    assertEquals(401, without.status());
    assertEquals("Bearer", without.header("WWW-Authenticate"));
    assertEquals(401, get("/api/network", "Authorization", "Bearer " + TOKEN + "x").status());
    assertEquals(200, get("/api/network", "Authorization", "Bearer " + TOKEN).status());
    assertEquals(401, send("POST", "/api/devices/127.0.1.1/stop", null, null).status());
    assertEquals(List.of(), agentCalls);

    Answer page = get("/");
    assertEquals(200, page.status());
    assertEquals("text/html; charset=utf-8", page.header("Content-Type"));
  }

  @Test
  void tokensAndListeningAddressesAreChecked() throws Exception {
    Path file = dir.resolve("token");
    Files.writeString(file, "  " + TOKEN + "\n");
    assertEquals(Optional.of(TOKEN), AdminServer.readToken(file));
    Files.writeString(file, "short-secret\n");
    assertTrue(assertThrows(AdminConfigException.class, () -> AdminServer.readToken(file)).getMessage()
        .contains("at least 16"));
    AdminServer.checkListen(new InetSocketAddress("127.3.0.1", 8161), Optional.empty());
    AdminServer.checkListen(new InetSocketAddress("0.0.0.0", 8161), Optional.of(TOKEN));
    AdminConfigException open = assertThrows(AdminConfigException.class,
        () -> AdminServer.checkListen(new InetSocketAddress("0.0.0.0", 8161), Optional.empty()));
    assertTrue(open.getMessage().contains("--admin-token-file"), open.getMessage());
  }
}
