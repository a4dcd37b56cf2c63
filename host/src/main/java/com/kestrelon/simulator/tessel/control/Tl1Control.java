package com.kestrelon.simulator.tessel.control;

import java.util.List;

/** What the TL1 agents of a running network do for the control interface. */
public interface Tl1Control {
  /** A network without TL1 agents: nobody to reach, nothing waiting, nothing counted. */
  Tl1Control NONE = new Tl1Control() {
    @Override
    public int sendMessages(Device device, List<Tl1Message> messages) {
      return 0;
    }

    @Override
    public boolean setAtag(Device device, int atag) {
      return false;
    }

    @Override
    public List<PendingCommand> pending(Device device) {
      return List.of();
    }

    @Override
    public boolean runPending(Device device, int id) {
      return false;
    }

    @Override
    public boolean cancelPending(Device device, int id) {
      return false;
    }

    @Override
    public Counters counters() {
      return new Counters(0, 0);
    }
  };

  /**
   * Queues the messages together for every client connected to the device, so that their
   * severities order them; the number of clients reached, 0 when none is connected (then nothing
   * is queued).
   */
  int sendMessages(Device device, List<Tl1Message> messages);

  /** Sets the ATAG the device's next autonomous message carries; false when no client is connected. */
  boolean setAtag(Device device, int atag);

  /** The device's commands waiting for their activation, oldest first. */
  List<PendingCommand> pending(Device device);

  /** Runs a waiting command now on its session; false when the device has no such entry. */
  boolean runPending(Device device, int id);

  /** Drops a waiting command without running it; false when the device has no such entry. */
  boolean cancelPending(Device device, int id);

  /** TL1 sessions open now and commands answered since the start, over every device. */
  Counters counters();

  /**
   * A command waiting for its activation time, or for a manual run when it gave only ON.
   *
   * @param on the ON the command gave, or null
   * @param date {@code YY-MM-DD} as the command gave it, or null
   * @param time {@code HH-MM-SS} as the command gave it, or null
   * @param command the command as it was received
   */
  record PendingCommand(int id, long session, Integer on, String date, String time, String command) {}

  record Counters(long sessions, long commands) {}
}
