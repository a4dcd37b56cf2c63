package com.kestrelon.simulator.tessel.control;

import com.kestrelon.simulator.tessel.snmp.SnmpHandler;
import java.net.InetAddress;
import java.net.UnknownHostException;
import java.util.ArrayList;
import java.util.HashMap;
import java.util.LinkedHashMap;
import java.util.List;
import java.util.Map;
import java.util.Optional;
import java.util.function.LongSupplier;
import java.util.function.Predicate;

/**
 * The informs sent through the control interface, the latest {@link #KEPT} of them, each pending
 * until the engine reports it answered or dropped. The engine reports an inform by its own ID;
 * an SNMPv3 inform gets that ID only once its manager is discovered, so a report with an ID not
 * yet known goes to the oldest SNMPv3 inform still waiting for one from the same device (or
 * user) to the same manager. A report may also arrive before the send that caused it has
 * returned; it is kept until the inform is added. Thread-safe.
 */
public final class InformLog implements SnmpHandler.InformListener {
  static final int KEPT = 1000;
  /** Reports of informs not (yet) added are forgotten beyond this many. */
  private static final int EARLY_KEPT = 1000;

  public enum State {
    PENDING, ACKNOWLEDGED, DROPPED;

    public String text() {
      return name().toLowerCase(java.util.Locale.ROOT);
    }
  }

  /** An inform as the control interface shows it; sends counts the InformRequests that left. */
  public record Entry(int id, State state, int sends, String device, String manager) {}

  private static final class Inform {
    final int id;
    final String device;
    final String manager;
    final InetAddress managerAddress; // numeric, as the engine reports it; null when unknown
    final int managerPort;
    final String user;
    final long timeoutMillis;
    final int retries;
    final long started;
    int engineId;
    State state = State.PENDING;
    long finished;

    Inform(int id, Device device, Notification n, InetAddress managerAddress, long started) {
      this.id = id;
      this.device = device.address();
      this.manager = n.manager();
      this.managerAddress = managerAddress;
      this.managerPort = n.managerPort();
      this.user = n.user();
      this.timeoutMillis = n.timeout() * 1000L;
      this.retries = n.retries();
      this.started = started;
    }

    boolean sentTo(String address, int port) {
      return managerAddress != null && port == managerPort && managerAddress.equals(numeric(address));
    }
  }

  private record Report(State state, long at) {}

  private final LongSupplier clock;
  private final LinkedHashMap<Integer, Inform> informs = new LinkedHashMap<>(); // by our ID
  private final Map<Integer, Inform> byEngineId = new HashMap<>();
  private final LinkedHashMap<Integer, Report> early = new LinkedHashMap<>();
  private int lastId;

  /** An inform log on the milliseconds of {@code clock} (a monotonic one). */
  public InformLog(LongSupplier clock) {
    this.clock = clock;
  }

  public InformLog() {
    this(() -> System.nanoTime() / 1_000_000);
  }

  /** Keeps an inform that the engine sent with engineId (0 when it gives one later); its ID here. */
  public int add(Device device, Notification notification, int engineId) {
    InetAddress managerAddress = numeric(notification.managerHost()); // may resolve: outside the lock
    synchronized (this) {
      return add(device, notification, managerAddress, engineId);
    }
  }

  private int add(Device device, Notification notification, InetAddress managerAddress, int engineId) {
    Inform inform = new Inform(++lastId, device, notification, managerAddress, clock.getAsLong());
    informs.put(inform.id, inform);
    if (informs.size() > KEPT) {
      Inform oldest = informs.values().iterator().next();
      informs.remove(oldest.id);
      byEngineId.remove(oldest.engineId);
    }
    if (engineId != 0) {
      inform.engineId = engineId;
      byEngineId.put(engineId, inform);
      Report report = early.remove(engineId);
      if (report != null) {
        finish(inform, report);
      }
    }
    return inform.id;
  }

  public synchronized Optional<Entry> find(int id) {
    return Optional.ofNullable(informs.get(id)).map(this::entry);
  }

  /** The informs kept, oldest first. */
  public synchronized List<Entry> all() {
    List<Entry> all = new ArrayList<>(informs.size());
    informs.values().forEach(inform -> all.add(entry(inform)));
    return all;
  }

  @Override
  public synchronized void answered(int informId, int requestId, String deviceAddress,
      String managerAddress, int managerPort, int errorStatus, int errorIndex, String[] oids,
      String[] types, String[] values) {
    report(informId, new Report(State.ACKNOWLEDGED, clock.getAsLong()),
        inform -> inform.device.equals(deviceAddress) && inform.sentTo(managerAddress, managerPort));
  }

  @Override
  public synchronized void dropped(int informId, int version, String community, String userName,
      String contextName, String managerAddress, int managerPort, String[] oids, String[] types,
      String[] values) {
    report(informId, new Report(State.DROPPED, clock.getAsLong()),
        inform -> inform.user.equals(userName) && inform.sentTo(managerAddress, managerPort));
  }

  private void report(int engineId, Report report, Predicate<Inform> sameSend) {
    Inform inform = byEngineId.get(engineId);
    if (inform == null) {
      inform = awaitingEngineId(sameSend);
      if (inform != null) {
        inform.engineId = engineId;
        byEngineId.put(engineId, inform);
      }
    }
    if (inform != null) {
      finish(inform, report);
      return;
    }
    early.put(engineId, report);
    if (early.size() > EARLY_KEPT) {
      early.remove(early.keySet().iterator().next());
    }
  }

  private Inform awaitingEngineId(Predicate<Inform> sameSend) {
    for (Inform inform : informs.values()) {
      if (inform.engineId == 0 && inform.state == State.PENDING && sameSend.test(inform)) {
        return inform;
      }
    }
    return null;
  }

  private static void finish(Inform inform, Report report) {
    if (inform.state == State.PENDING) {
      inform.state = report.state();
      inform.finished = report.at();
    }
  }

  /**
   * The InformRequests sent so far, from the inform's timing: one at once and one more at each
   * timeout while retries are left. A dropped inform's last send was one timeout before the drop,
   * so an inform dropped at once (its manager never discovered) sent none.
   */
  private Entry entry(Inform inform) {
    long elapsed = (inform.state == State.PENDING ? clock.getAsLong() : inform.finished) - inform.started;
    long timeouts = Math.max(0, elapsed) / Math.max(1, inform.timeoutMillis);
    long sends = switch (inform.state) {
      case DROPPED -> Math.round((double) Math.max(0, elapsed) / Math.max(1, inform.timeoutMillis));
      default -> timeouts + 1;
    };
    int capped = (int) Math.min(sends, 1L + inform.retries);
    return new Entry(inform.id, inform.state, capped, inform.device, inform.manager);
  }

  /** The numeric address of a host text that is already numeric; null for a name. */
  private static InetAddress numeric(String host) {
    if (!host.matches("[0-9.]+|[0-9a-fA-F:.]*:[0-9a-fA-F:.]*")) {
      return resolved(host);
    }
    try {
      return InetAddress.getByName(host);
    } catch (UnknownHostException e) {
      return null;
    }
  }

  /** A name as the engine resolves it: to an IPv4 address. */
  private static InetAddress resolved(String host) {
    try {
      for (InetAddress address : InetAddress.getAllByName(host)) {
        if (address instanceof java.net.Inet4Address) {
          return address;
        }
      }
    } catch (UnknownHostException e) {
      // No address to match a report by; the inform is matched by the engine's ID alone.
    }
    return null;
  }
}
