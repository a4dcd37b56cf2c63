package com.kestrelon.simulator.tessel.snmp;

import static org.junit.jupiter.api.Assertions.assertArrayEquals;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertNotNull;
import static org.junit.jupiter.api.Assertions.assertThrows;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.kestrelon.simulator.tessel.NetworkSimulator;
import java.net.DatagramPacket;
import java.net.DatagramSocket;
import java.net.InetAddress;
import java.net.InetSocketAddress;
import java.net.SocketTimeoutException;
import java.util.concurrent.ArrayBlockingQueue;
import java.util.concurrent.BlockingQueue;
import java.util.concurrent.TimeUnit;
import org.junit.jupiter.api.AfterEach;
import org.junit.jupiter.api.BeforeEach;
import org.junit.jupiter.api.Test;

/** The notification exports in a real JVM: what a manager on loopback receives, and the replies. */
class NotificationExportsTest {
  private static final String DEVICE = "127.79.1.1";
  private static final int PORT = 20007 + (int) (ProcessHandle.current().pid() % 300) * 40;
  private static final int AGENT_ID = 9;

  private final NetworkSimulator simulator = new NetworkSimulator();
  private final SnmpHandler handler = new SnmpHandler();
  private final BlockingQueue<String> informs = new ArrayBlockingQueue<>(4);
  private DatagramSocket manager;

  @BeforeEach
  void startDevice() throws Exception {
    assertTrue(simulator.nativeInitAgentParams(false, (byte) 0, "", 0, 1 << 20));
    assertTrue(handler.jniJVMparams());
    int[] sockets = handler.startSnmpNetwork(new int[] {AGENT_ID}, new String[] {"t"},
        new String[] {DEVICE}, new int[] {PORT}, new String[] {"public"},
        new String[] {"private"}, new int[] {0}, "db", new int[] {0});
    assertTrue(sockets[0] > 2, "the device runs");
    assertTrue(handler.initSnmpThread());
    handler.setInformListener(new SnmpHandler.InformListener() {
      @Override
      public void answered(int informId, int requestId, String deviceAddress,
          String managerAddress, int managerPort, int errorStatus, int errorIndex, String[] oids,
          String[] types, String[] values) {
        informs.add("answered " + deviceAddress + " " + managerAddress + ":" + managerPort + " "
            + oids[1] + " " + types[2] + " " + values[2]);
      }

      @Override
      public void dropped(int informId, int version, String community, String userName,
          String contextName, String managerAddress, int managerPort, String[] oids,
          String[] types, String[] values) {
        informs.add("dropped " + managerAddress + ":" + managerPort);
      }
    });
    manager = new DatagramSocket(new InetSocketAddress("127.0.0.1", 0));
    manager.setSoTimeout(3000);
  }

  @AfterEach
  void stopEngine() {
    manager.close();
    assertTrue(simulator.AdapterJniStopNetwork());
  }

  private DatagramPacket receive() throws Exception {
    DatagramPacket packet = new DatagramPacket(new byte[2048], 2048);
    manager.receive(packet);
    assertEquals(new InetSocketAddress(DEVICE, PORT), packet.getSocketAddress(),
        "sent from the device's own address and port");
    return packet;
  }

  /** The PDU's type octet, behind 30 82 LL LL, the version and the community. */
  private static int pduOffset(DatagramPacket packet) {
    return 4 + 3 + 2 + packet.getData()[8];
  }

  private static int pduType(DatagramPacket packet) {
    return packet.getData()[pduOffset(packet)] & 0xff;
  }

  private int port() {
    return manager.getLocalPort();
  }

  @Test
  void trapsLeaveFromTheDevice() throws Exception {
    new SnmpTrapService().SendV2Trap("127.0.0.1", port(), "public", ".1.3.6.1.4.1.99.0.7",
        new String[] {".1.3.6.1.2.1.1.5.0"}, new int[] {4}, new String[] {"core-7"}, AGENT_ID,
        DEVICE, 1);
    assertEquals(0xa7, pduType(receive()));
    new SnmpTrapService().SendV1Trap("127.0.0.1", port(), "public", ".1.3.6.1.4.1.99", 6, 7,
        null, null, null, AGENT_ID, DEVICE);
    assertEquals(0xa4, pduType(receive()));
    handler.SendV2TimerTrap("localhost", port(), "public", ".1.3.6.1.6.3.1.1.5.3", null, null,
        null, AGENT_ID, DEVICE, 1);
    assertEquals(0xa7, pduType(receive()));
    handler.SendV1TimerTrap("127.0.0.1", port(), "public", ".1.3.6.1.4.1.99", 6, 7,
        new String[] {"1.3.6.1.1", "1.3.6.1.2"}, new int[] {2, 2}, new String[] {"1"}, AGENT_ID,
        DEVICE);
    manager.setSoTimeout(300);
    assertThrows(SocketTimeoutException.class, () -> manager.receive(
        new DatagramPacket(new byte[2048], 2048)), "arrays of different lengths send nothing");
  }

  @Test
  void answeredInformReachesTheHandler() throws Exception {
    new SnmpInformInterfaceImpl().SendV2Inform("127.0.0.1", port(), "public",
        ".1.3.6.1.4.1.99.0.7", new String[] {".1.3.6.1.2.1.2.2.1.1.2"}, new int[] {2},
        new String[] {"2"}, AGENT_ID, DEVICE, 2);
    DatagramPacket inform = receive();
    assertEquals(0xa6, pduType(inform));
    byte[] response = java.util.Arrays.copyOf(inform.getData(), inform.getLength());
    response[pduOffset(inform)] = (byte) 0xa2;
    manager.send(new DatagramPacket(response, response.length, InetAddress.getByName(DEVICE),
        PORT));
    String reported = informs.poll(3, TimeUnit.SECONDS);
    assertNotNull(reported);
    assertEquals("answered " + DEVICE + " 127.0.0.1:" + port()
        + " .1.3.6.1.6.3.1.1.4.1.0 Integer 2", reported);
    assertArrayEquals(new Object[0], informs.toArray(), "reported once");
  }
}
