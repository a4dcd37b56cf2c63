package com.kestrelon.simulator.tessel.cli;

import com.kestrelon.simulator.tessel.control.Device;
import com.kestrelon.simulator.tessel.control.ProtocolAgents;
import com.kestrelon.simulator.tessel.network.Network;
import com.kestrelon.simulator.tessel.network.Network.Cli;
import com.kestrelon.simulator.tessel.network.Network.Group;
import java.io.IOException;
import java.nio.charset.StandardCharsets;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.LinkedHashMap;
import java.util.List;
import java.util.Map;
import java.util.Optional;

/**
 * The CLI agents of a network: every device of a group with a {@code cli} section answers a router
 * CLI over Telnet (and SSH when the group gives a port) on its own address, with the group's login
 * user and enable secret. A device starts, and starts again after a stop, from its startup
 * configuration, as a router reloads, and registers under the hostname of that configuration.
 *
 * <p>Starts and stops are not safe to run concurrently with each other: the launcher starts the
 * groups one after another and the device table serialises the control interface's.
 */
public final class CliNetwork implements ProtocolAgents {
  static final String LOGIN_PROMPT = "Username: ";
  static final String PASSWORD_PROMPT = "Password: ";
  static final String PROMPT = "$DEVICENAME>";
  /** Where the engine reads the added modes, below its base directory (the working directory). */
  static final Path MODES_FILE = Path.of("conf", "IosModes.prop");
  static final Path PROMPTS_FILE = Path.of("conf", "IosPrompts.prop");
  private static final int STARTED = 1;
  private static final int TELNET = 0;

  private final Network network;
  private final Map<String, Group> groupByName = new LinkedHashMap<>();
  private final CliHandler handler;
  private final Path baseDirectory;

  /** The CLI groups of the network, served by handler; the engine's base directory is the working directory. */
  public CliNetwork(Network network, CliHandler handler) {
    this(network, handler, Path.of(""));
  }

  CliNetwork(Network network, CliHandler handler, Path baseDirectory) {
    this.network = network;
    this.handler = handler;
    this.baseDirectory = baseDirectory;
    network.groups().stream().filter(group -> group.cli().isPresent())
        .forEach(group -> groupByName.put(group.name(), group));
  }

  public boolean isEmpty() {
    return groupByName.isEmpty();
  }

  public CliHandler handler() {
    return handler;
  }

  /**
   * Tells the handler every device it serves, hands it to the engine with the prompts, the SSH key
   * folder and the added modes, and starts the engine's CLI service; call once, after the engine is
   * initialised. Empty when the service runs, else why not.
   */
  public Optional<String> register() {
    for (Group group : groupByName.values()) {
      Cli cli = group.cli().orElseThrow();
      for (int i = 0; i < group.count(); i++) {
        handler.addDevice(group.address(i), cli.data(), group.deviceName(i));
      }
    }
    if (!handler.jniJVMParams()) {
      return Optional.of("the engine did not accept the CLI host");
    }
    handler.setCliLoginPrompt(LOGIN_PROMPT);
    handler.setCliPasswordPrompt(PASSWORD_PROMPT);
    handler.setCliPromptString(PROMPT);
    Path keys = network.stateDir().resolve("ssh");
    try {
      Files.createDirectories(keys);
      Optional<String> refused = writeAddedModes();
      if (refused.isPresent()) {
        return refused;
      }
    } catch (IOException e) {
      return Optional.of("cannot write " + e.getMessage());
    }
    handler.setSSHKeyPath(keys.toAbsolutePath().toString());
    if (!handler.initCliThread()) {
      return Optional.of("the engine's CLI service did not start");
    }
    return Optional.empty();
  }

  /**
   * The engine reads the modes a data file adds from its base directory: the files are written
   * there when some group's data adds modes, and must then agree between groups.
   */
  private Optional<String> writeAddedModes() throws IOException {
    CliData adding = null;
    for (Group group : groupByName.values()) {
      CliData data = group.cli().orElseThrow().data();
      if (data.addedModes().isEmpty()) {
        continue;
      }
      if (adding != null && !adding.addedModes().equals(data.addedModes())) {
        return Optional.of("the CLI data files " + adding.name() + " and " + data.name()
            + " add different modes; the engine knows one list of added modes");
      }
      adding = data;
    }
    if (adding != null) {
      Files.createDirectories(baseDirectory.resolve(MODES_FILE).getParent());
      Files.writeString(baseDirectory.resolve(MODES_FILE), adding.modesFile(), StandardCharsets.UTF_8);
      Files.writeString(baseDirectory.resolve(PROMPTS_FILE), adding.promptsFile(), StandardCharsets.UTF_8);
      handler.setUserAddedModesAndNames();
    }
    return Optional.empty();
  }

  /**
   * Registers and opens devices [first, first + count) of a CLI group, each from its startup
   * configuration; per device, empty when it serves, else why it could not open.
   */
  public List<Optional<String>> startAgents(Group group, int first, int count) {
    Cli cli = group.cli().orElseThrow();
    int firstId = network.firstAgentId(group);
    List<Optional<String>> outcomes = new ArrayList<>(count);
    List<Integer> registered = new ArrayList<>();
    for (int i = 0; i < count; i++) {
      String address = group.address(first + i);
      String name = handler.reload(address).orElse(group.deviceName(first + i));
      int accepted = handler.nativePassCliAgentInfo(cli.user(), cli.password(), cli.enable(), address, cli.port(),
          group.name(), address, "", "", name, firstId + first + i, 0);
      outcomes.add(accepted == STARTED ? Optional.empty() : Optional.of("the engine refused the CLI agent on " + address));
      if (accepted == STARTED) {
        registered.add(i);
      }
    }
    String[] addresses = registered.stream().map(i -> group.address(first + i)).toArray(String[]::new);
    int[] ports = registered.stream().mapToInt(i -> cli.port()).toArray();
    int[] started = addresses.length == 0 ? new int[0] : handler.startCliNetwork(addresses, ports, TELNET, 0, 0);
    for (int r = 0; r < addresses.length; r++) {
      boolean opened = started != null && r < started.length && started[r] == STARTED;
      outcomes.set(registered.get(r), opened ? afterOpen(cli, addresses[r]) : Optional.of(cannotOpen(cli.port(), addresses[r])));
    }
    return outcomes;
  }

  /** The SSH listener of a device whose Telnet listener opened. */
  private Optional<String> afterOpen(Cli cli, String address) {
    if (cli.sshPort().isPresent() && !handler.startSshListener(address, cli.sshPort().getAsInt(), cli.port())) {
      // Half a device is not served: its Telnet listener closes too, and it is failed as a whole.
      handler.stopCLIAgent(address, cli.port(), TELNET);
      return Optional.of(cannotOpen(cli.sshPort().getAsInt(), address));
    }
    return Optional.empty();
  }

  private static String cannotOpen(int port, String address) {
    return "the CLI agent cannot open TCP port " + port + " on " + address + " (is another program using it?)";
  }

  @Override
  public Optional<String> start(Device device) {
    Group group = groupByName.get(device.group());
    return startAgents(group, device.agentId() - network.firstAgentId(group), 1).get(0);
  }

  @Override
  public void stop(Device device) {
    handler.stopCLIAgent(device.address(), groupByName.get(device.group()).cli().orElseThrow().port(), TELNET);
  }
}
