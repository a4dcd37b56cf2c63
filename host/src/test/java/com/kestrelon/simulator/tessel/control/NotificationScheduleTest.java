package com.kestrelon.simulator.tessel.control;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertFalse;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.kestrelon.simulator.tessel.control.NotificationSender.Outcome;
import com.kestrelon.simulator.tessel.control.NotificationSender.Result;
import com.kestrelon.simulator.tessel.network.Network;
import com.kestrelon.simulator.tessel.network.Network.Group;
import com.kestrelon.simulator.tessel.network.Network.Scheduled;
import com.kestrelon.simulator.tessel.network.Network.TrapSink;
import java.io.ByteArrayOutputStream;
import java.io.PrintStream;
import java.math.BigInteger;
import java.nio.file.Path;
import java.time.Duration;
import java.util.ArrayList;
import java.util.List;
import java.util.Map;
import java.util.Optional;
import java.util.concurrent.BlockingQueue;
import java.util.concurrent.LinkedBlockingQueue;
import java.util.concurrent.TimeUnit;
import java.util.concurrent.atomic.AtomicBoolean;
import org.junit.jupiter.api.Test;

/** The timer's turns over a group, stopped devices, failed sends, and the sinks as receivers. */
class NotificationScheduleTest {
  private static final long PERIOD_MS = 900;

  private record Sent(String device, long atMillis, Notification notification) {}

  private static Notification toManager(boolean inform) {
    return new Notification(inform, Notification.Version.V2C, "127.0.0.1", 1162, "public", "", "",
        "1.3.6.1.4.1.9.1", "", 0, 0, List.of(), 5, 1);
  }

  @Test
  void devicesTakeTurnsOverThePeriodAndAStoppedOneSendsNothing() throws Exception {
    DeviceTable.Builder builder = new DeviceTable.Builder();
    for (int i = 0; i < 3; i++) {
      builder.add(0x7F000101L + i, 10 + i, "R" + i, "r", Map.of("snmp", AgentState.RUNNING));
    }
    DeviceTable table = builder.build(Map.of("snmp", new ProtocolAgents() {
      @Override
      public Optional<String> start(Device device) {
        return Optional.empty();
      }

      @Override
      public void stop(Device device) {}
    }));
    BlockingQueue<Sent> sends = new LinkedBlockingQueue<>();
    AtomicBoolean failedOnce = new AtomicBoolean();
    NotificationSender sender = (device, n) -> {
      if (device.address().equals("127.0.1.3") && failedOnce.compareAndSet(false, true)) {
        throw new IllegalStateException("the engine could not read the notification");
      }
      sends.add(new Sent(device.address(), System.nanoTime() / 1_000_000, n));
      return new Outcome(Result.SENT, 40 + device.agentId());
    };
    Group group = new Group("r", 3, 0x7F000101L, "R{n}", Optional.empty(), List.of(),
        List.of(new Scheduled(Duration.ofMillis(PERIOD_MS), false, toManager(true))));
    Network network = new Network(new Network.Log(0, Path.of("t.log")), Optional.empty(), Path.of("."), List.of(group));
    InformLog informs = new InformLog();
    ByteArrayOutputStream errors = new ByteArrayOutputStream();
    NotificationSchedule schedule =
        NotificationSchedule.start(network, table, sender, informs, new PrintStream(errors, true));
    try {
      // .3's first turn fails: its first send to arrive is a period later, after .1's second.
      List<Sent> first = takeFor(sends, 3, PERIOD_MS * 3);
      assertEquals(List.of("127.0.1.1", "127.0.1.2", "127.0.1.1"), first.stream().map(Sent::device).toList());
      long gap = first.get(1).atMillis() - first.get(0).atMillis();
      assertTrue(gap >= PERIOD_MS / 6 && gap < PERIOD_MS * 2 / 3, "turns " + gap + " ms apart");
      assertTrue(first.get(2).atMillis() - first.get(0).atMillis() >= PERIOD_MS * 2 / 3);

      table.stop("127.0.1.2", Optional.empty());
      sends.clear();
      List<Sent> later = takeFor(sends, Integer.MAX_VALUE, PERIOD_MS * 3);
      List<String> senders = later.stream().map(Sent::device).toList();
      assertFalse(senders.contains("127.0.1.2"), senders.toString());
      assertTrue(senders.contains("127.0.1.1") && senders.contains("127.0.1.3"), senders.toString());
    } finally {
      schedule.close();
    }
    assertTrue(errors.toString().contains("127.0.1.3 to 127.0.0.1:1162 not sent"), errors.toString());
    assertTrue(informs.all().stream().anyMatch(entry -> entry.device().equals("127.0.1.2")));
    sends.clear();
    assertTrue(takeFor(sends, 1, PERIOD_MS).isEmpty(), "a closed schedule sends nothing");
  }

  /** What arrives within {@code millis}, up to {@code count} sends. */
  private static List<Sent> takeFor(BlockingQueue<Sent> sends, int count, long millis) throws InterruptedException {
    long deadline = System.nanoTime() + TimeUnit.MILLISECONDS.toNanos(millis);
    List<Sent> taken = new ArrayList<>();
    while (taken.size() < count) {
      Sent next = sends.poll(deadline - System.nanoTime(), TimeUnit.NANOSECONDS);
      if (next == null) {
        break;
      }
      taken.add(next);
    }
    return taken;
  }

  @Test
  void turnsSpreadOverADayForTheLargestGroupWithoutOverflow() {
    long day = Duration.ofDays(1).toNanos();
    long n = Integer.MAX_VALUE;
    BigInteger dayTimes = BigInteger.valueOf(day);
    for (long i : new long[] {0, 1, n / 3, n - 1}) {
      long exact = BigInteger.valueOf(i).multiply(dayTimes).divide(BigInteger.valueOf(n)).longValueExact();
      assertEquals(exact, NotificationSchedule.turn(i, n, day), "turn of device " + i);
    }
  }

  @Test
  void eachSinkReceivesInItsOwnVersionAndIdentityAndV1SinksNoInform() {
    List<TrapSink> sinks = List.of(new TrapSink("v1", "10.0.0.1", 162, "one", "", "", false, 5, 0),
        new TrapSink("v2c", "10.0.0.2", 1162, "two", "", "", true, 3, 2),
        new TrapSink("v3", "::1", 2162, "", "u", "ctx", false, 7, 1));
    Notification v1Form = new Notification(false, Notification.Version.V1, "127.0.0.1", 162, "public", "", "",
        "", "1.3.6.1.4.1.9", 6, 7, List.of(new Notification.Binding("1.3.6.1.2", 2, "1")), 5, 0);
    List<Notification> traps = NotificationSchedule.targets(new Scheduled(Duration.ofSeconds(1), true, v1Form), sinks);
    assertEquals(List.of("10.0.0.1:162 V1 one", "10.0.0.2:1162 V2C two", "[::1]:2162 V3 u/ctx"), traps.stream()
        .map(n -> n.manager() + " " + n.version() + " " + (n.user().isEmpty() ? n.community() : n.user() + "/"
            + n.context())).toList());
    assertTrue(traps.stream().allMatch(n -> n.enterprise().equals("1.3.6.1.4.1.9") && n.specific() == 7
        && n.bindings().equals(v1Form.bindings()) && !n.inform()));
    assertEquals(List.of(3, 2), List.of(traps.get(1).timeout(), traps.get(1).retries()));

    List<Notification> informs =
        NotificationSchedule.targets(new Scheduled(Duration.ofSeconds(1), true, toManager(true)), sinks);
    assertEquals(List.of("10.0.0.2:1162", "[::1]:2162"), informs.stream().map(Notification::manager).toList());
    assertTrue(informs.stream().allMatch(Notification::inform));
    Scheduled direct = new Scheduled(Duration.ofSeconds(1), false, toManager(false));
    assertEquals(List.of(direct.notification()), NotificationSchedule.targets(direct, sinks));
  }
}
