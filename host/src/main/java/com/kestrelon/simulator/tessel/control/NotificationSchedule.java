package com.kestrelon.simulator.tessel.control;

import com.kestrelon.simulator.tessel.network.Network;
import com.kestrelon.simulator.tessel.network.Network.Group;
import com.kestrelon.simulator.tessel.network.Network.Scheduled;
import com.kestrelon.simulator.tessel.network.Network.TrapSink;
import java.io.PrintStream;
import java.util.ArrayList;
import java.util.List;
import java.util.Optional;
import java.util.Set;
import java.util.concurrent.ConcurrentHashMap;
import java.util.concurrent.Executors;
import java.util.concurrent.ScheduledExecutorService;
import java.util.concurrent.TimeUnit;

/**
 * Sends the groups' scheduled notifications from one timer thread. The devices of a group take
 * turns over the period: device i of n first sends i × period / n after the schedule starts, then
 * once every period, so that a large group does not send all at once. A device that is not running
 * when its turn comes sends nothing that turn.
 */
public final class NotificationSchedule implements AutoCloseable {
  private final ScheduledExecutorService timer = Executors.newSingleThreadScheduledExecutor(task -> {
    Thread thread = new Thread(task, "tessel-notification-schedule");
    thread.setDaemon(true);
    return thread;
  });
  private final DeviceTable devices;
  private final NotificationSender sender;
  private final InformLog informs;
  private final PrintStream err;
  /** Refusals already reported, so that a faulty entry does not fill the output every period. */
  private final Set<String> reported = ConcurrentHashMap.newKeySet();

  private NotificationSchedule(DeviceTable devices, NotificationSender sender, InformLog informs, PrintStream err) {
    this.devices = devices;
    this.sender = sender;
    this.informs = informs;
    this.err = err;
  }

  /** Starts sending the notifications of every group of {@code network} from its devices. */
  public static NotificationSchedule start(Network network, DeviceTable devices, NotificationSender sender,
      InformLog informs, PrintStream err) {
    NotificationSchedule schedule = new NotificationSchedule(devices, sender, informs, err);
    for (Group group : network.groups()) {
      List<TrapSink> sinks = new ArrayList<>(network.trapSinks());
      sinks.addAll(group.trapSinks());
      for (Scheduled entry : group.notifications()) {
        schedule.add(group, entry, targets(entry, sinks));
      }
    }
    return schedule;
  }

  /** What one device sends each turn of {@code entry}: one notification per manager. */
  static List<Notification> targets(Scheduled entry, List<TrapSink> sinks) {
    Notification n = entry.notification();
    if (!entry.toSinks()) {
      return List.of(n);
    }
    List<Notification> targets = new ArrayList<>();
    for (TrapSink sink : sinks) {
      if (n.inform() && sink.versionNumber() == Notification.Version.V1.number()) {
        continue; // SNMPv1 has no inform
      }
      Notification.Version version = Notification.version(sink.version());
      targets.add(new Notification(n.inform(), version, sink.address(), sink.port(), sink.community(),
          sink.user(), sink.context(), n.oid(), n.enterprise(), n.generic(), n.specific(), n.bindings(),
          sink.timeout(), sink.retries()));
    }
    return targets;
  }

  private void add(Group group, Scheduled entry, List<Notification> targets) {
    long period = entry.every().toNanos();
    for (int i = 0; i < group.count(); i++) {
      String address = group.address(i);
      long first = turn(i, group.count(), period);
      timer.scheduleAtFixedRate(() -> fire(address, targets), first, period, TimeUnit.NANOSECONDS);
    }
  }

  /**
   * i × period / n, rounded down, without overflow: with period = q × n + r it is i × q + i × r / n,
   * where i × r stays below n² (at most 2⁶²).
   */
  static long turn(long i, long n, long period) {
    return i * (period / n) + i * (period % n) / n;
  }

  private void fire(String address, List<Notification> targets) {
    Optional<Device> device = devices.find(address);
    if (device.isEmpty() || !device.get().running()) {
      return;
    }
    for (Notification notification : targets) {
      try {
        NotificationSender.Outcome outcome = sender.send(device.get(), notification);
        if (outcome.result() == NotificationSender.Result.SENT && notification.inform()) {
          informs.add(device.get(), notification, outcome.engineInformId());
        } else if (outcome.result() != NotificationSender.Result.SENT) {
          reportOnce(address + " to " + notification.manager(), outcome.result().reason());
        }
      } catch (RuntimeException e) {
        // A failed send must not end the device's turns (the timer drops a task that throws).
        reportOnce(address + " to " + notification.manager(), String.valueOf(e.getMessage()));
      }
    }
  }

  private void reportOnce(String what, String reason) {
    if (reported.add(what + reason)) {
      err.println("scheduled notification from " + what + " not sent: " + reason);
    }
  }

  /** Stops every device's turns; a notification being sent finishes first. */
  @Override
  public void close() {
    timer.shutdownNow();
    try {
      timer.awaitTermination(5, TimeUnit.SECONDS);
    } catch (InterruptedException e) {
      Thread.currentThread().interrupt();
    }
  }
}
