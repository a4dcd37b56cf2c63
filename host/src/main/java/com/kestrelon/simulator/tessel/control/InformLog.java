package com.kestrelon.simulator.tessel.control;

import com.kestrelon.simulator.tessel.snmp.SnmpHandler;
import java.util.ArrayList;
import java.util.HashMap;
import java.util.LinkedHashMap;
import java.util.List;
import java.util.Locale;
import java.util.Map;
import java.util.Optional;
import java.util.function.LongSupplier;

/**
 * The informs sent through the control interface, the latest {@link #KEPT} of them, each pending
 * until the engine reports it answered or dropped under the inform ID it gave when it took the
 * inform. A report may arrive before the send that caused it has returned; it is kept until the
 * inform is added. Thread-safe.
 */
public final class InformLog implements SnmpHandler.InformListener {
  static final int KEPT = 1000;
  /** Reports of informs not (yet) added are forgotten beyond this many. */
  private static final int EARLY_KEPT = 1000;

  public enum State {
    PENDING, ACKNOWLEDGED, DROPPED;

    public String text() {
      return name().toLowerCase(Locale.ROOT);
    }
  }

  /** An inform as the control interface shows it; sends counts the InformRequests that left. */
  public record Entry(int id, State state, int sends, String device, String manager) {}

  private static final class Inform {
    final int id;
    final int engineId;
    final String device;
    final String manager;
    final long timeoutMillis;
    final int retries;
    final long started;
    State state = State.PENDING;
    long finished;

    Inform(int id, int engineId, Device device, Notification n, long started) {
      this.id = id;
      this.engineId = engineId;
      this.device = device.address();
      this.manager = n.manager();
      this.timeoutMillis = n.timeout() * 1000L;
      this.retries = n.retries();
      this.started = started;
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

  /** Keeps an inform that the engine took as engineId; its ID here. */
  public synchronized int add(Device device, Notification notification, int engineId) {
    Inform inform = new Inform(++lastId, engineId, device, notification, clock.getAsLong());
    informs.put(inform.id, inform);
    if (informs.size() > KEPT) {
      Inform oldest = informs.values().iterator().next();
      informs.remove(oldest.id);
      byEngineId.remove(oldest.engineId, oldest);
    }
    byEngineId.put(engineId, inform);
    Report report = early.remove(engineId);
    if (report != null) {
      finish(inform, report);
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
  public void answered(int informId, int requestId, String deviceAddress, String managerAddress,
      int managerPort, int errorStatus, int errorIndex, String[] oids, String[] types, String[] values) {
    report(informId, State.ACKNOWLEDGED);
  }

  @Override
  public void dropped(int informId, int version, String community, String userName, String contextName,
      String managerAddress, int managerPort, String[] oids, String[] types, String[] values) {
    report(informId, State.DROPPED);
  }

  private synchronized void report(int engineId, State state) {
    Report report = new Report(state, clock.getAsLong());
    Inform inform = byEngineId.get(engineId);
    if (inform != null) {
      finish(inform, report);
      return;
    }
    early.put(engineId, report);
    if (early.size() > EARLY_KEPT) {
      early.remove(early.keySet().iterator().next());
    }
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
   * so an inform dropped at once (an SNMPv3 manager that never answered discovery) sent none.
   */
  private Entry entry(Inform inform) {
    long elapsed = Math.max(0, (inform.state == State.PENDING ? clock.getAsLong() : inform.finished) - inform.started);
    long timeout = Math.max(1, inform.timeoutMillis);
    long sends = inform.state == State.DROPPED ? Math.round((double) elapsed / timeout) : elapsed / timeout + 1;
    int capped = (int) Math.min(sends, 1L + inform.retries);
    return new Entry(inform.id, inform.state, capped, inform.device, inform.manager);
  }
}
