package com.kestrelon.simulator.tessel.control;

import com.kestrelon.simulator.tessel.tl1.TL1AlarmImpl;
import com.kestrelon.simulator.tessel.tl1.TL1Register;
import java.util.ArrayList;
import java.util.List;

/** The control interface's TL1 actions, carried out by the engine's TL1 service. */
public final class NativeTl1Control implements Tl1Control {
  /** The fields of one waiting command as the engine lists it, joined by TAB. */
  private static final int PENDING_FIELDS = 6;

  private final TL1Register register;
  private final TL1AlarmImpl alarms;

  public NativeTl1Control() {
    this(new TL1Register(), new TL1AlarmImpl());
  }

  NativeTl1Control(TL1Register register, TL1AlarmImpl alarms) {
    this.register = register;
    this.alarms = alarms;
  }

  @Override
  public int sendMessages(Device device, List<Tl1Message> messages) {
    int count = messages.size();
    String[] verbs = new String[count];
    String[] modifiers1 = new String[count];
    String[] modifiers2 = new String[count];
    byte[] codes = new byte[count];
    String[][] lines = new String[count][];
    int[][] lineTypes = new int[count][];
    for (int m = 0; m < count; m++) {
      Tl1Message message = messages.get(m);
      verbs[m] = message.verb();
      modifiers1[m] = message.modifiers().size() > 0 ? message.modifiers().get(0) : null;
      modifiers2[m] = message.modifiers().size() > 1 ? message.modifiers().get(1) : null;
      codes[m] = message.severity().code();
      lines[m] = message.lines().stream().map(Tl1Message.Line::text).toArray(String[]::new);
      lineTypes[m] = message.lines().stream().mapToInt(line -> line.type().engineType()).toArray();
    }
    return alarms.sendAutonomousBatch(verbs, modifiers1, modifiers2, codes, lines, lineTypes, device.agentId());
  }

  /**
   * The engine sets the ATAG of the device's first client and says nothing back; an empty batch,
   * which queues nothing, first tells whether there is a client at all.
   */
  @Override
  public boolean setAtag(Device device, int atag) {
    if (alarms.sendAutonomousBatch(new String[0], new String[0], new String[0], new byte[0], new String[0][],
        new int[0][], device.agentId()) == 0) {
      return false;
    }
    alarms.SetAtagValue(atag, device.agentId());
    return true;
  }

  @Override
  public List<PendingCommand> pending(Device device) {
    String[] entries = register.listPending(device.agentId());
    List<PendingCommand> pending = new ArrayList<>();
    for (String entry : entries == null ? new String[0] : entries) {
      String[] fields = entry.split("\t", PENDING_FIELDS);
      if (fields.length == PENDING_FIELDS) {
        pending.add(new PendingCommand(Integer.parseInt(fields[0]), Long.parseLong(fields[1]), on(fields[2]),
            orNull(fields[3]), orNull(fields[4]), fields[5]));
      }
    }
    return pending;
  }

  /** The ON a command gave; the engine lists a negative number (or nothing) for none. */
  private static Integer on(String field) {
    int on = field.isEmpty() ? -1 : Integer.parseInt(field);
    return on < 0 ? null : on;
  }

  private static String orNull(String field) {
    return field.isEmpty() ? null : field;
  }

  @Override
  public boolean runPending(Device device, int id) {
    return register.runPending(device.agentId(), id);
  }

  @Override
  public boolean cancelPending(Device device, int id) {
    return register.cancelPending(device.agentId(), id);
  }

  @Override
  public Counters counters() {
    long[] counters = register.tl1Counters();
    return counters == null || counters.length < 2 ? new Counters(0, 0) : new Counters(counters[0], counters[1]);
  }
}
