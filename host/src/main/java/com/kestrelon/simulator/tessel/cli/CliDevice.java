package com.kestrelon.simulator.tessel.cli;

import com.kestrelon.simulator.tessel.cli.CliData.Action;
import com.kestrelon.simulator.tessel.cli.CliData.Command;
import com.kestrelon.simulator.tessel.cli.CliMatcher.Match;
import com.kestrelon.simulator.tessel.cli.CliMatcher.Outcome;
import java.util.ArrayList;
import java.util.List;

/**
 * One CLI device: what its commands mean and its running and startup configuration. Every method
 * holds the device's lock, so sessions on one device may configure it at the same time; devices
 * share nothing but their immutable data. The configurations are made from the data only when
 * first used, so a device nobody configures costs little.
 */
final class CliDevice {
  static final int CLOSING = 8;
  static final String INVALID_INPUT = "% Invalid input detected at '^' marker.";
  static final String INCOMPLETE = "% Incomplete command.";

  private final String address;
  private final CliData data;
  private final CliMatcher matcher;
  private final String initialName;
  private String name;
  private RunningConfig running; // null: the data's configuration named initialName, untouched
  private RunningConfig startup; // null: the same

  /** The reply to the engine: key/value pairs applied in order. */
  static final class Reply {
    private final List<String> pairs = new ArrayList<>();

    void add(String key, String value) {
      pairs.add(key);
      pairs.add(value);
    }

    void response(String text) {
      add("response", text);
    }

    void level(int mode) {
      add("level", Integer.toString(mode));
    }

    /** The response texts alone, for a command run on behalf of another (do). */
    List<String> responses() {
      List<String> texts = new ArrayList<>();
      for (int i = 0; i < pairs.size(); i += 2) {
        if (pairs.get(i).equals("response")) {
          texts.add(pairs.get(i + 1));
        }
      }
      return texts;
    }

    String[] toArray() {
      return pairs.isEmpty() ? null : pairs.toArray(new String[0]);
    }
  }

  CliDevice(String address, CliData data, CliMatcher matcher, String name) {
    this.address = address;
    this.data = data;
    this.matcher = matcher;
    this.initialName = name;
    this.name = name;
  }

  synchronized String name() {
    return name;
  }

  /** Goes back to the startup configuration, as a router reloads; answers the name it then has. */
  synchronized String reload() {
    running = startup == null ? null : startup.copy();
    name = running == null ? initialName : running.hostname();
    return name;
  }

  synchronized String runningConfig() {
    return config().text();
  }

  /** The reply to a line typed in a mode, inside the block {@code context} ("" for none); null for none. */
  synchronized String[] enter(String line, int mode, String context) {
    if (line == null || line.isBlank()) {
      return null;
    }
    Reply reply = new Reply();
    execute(line, mode, context == null ? "" : context, reply, promptLength(mode));
    return reply.toArray();
  }

  synchronized String help(String line, int mode) {
    return matcher.help(mode, line == null ? "" : line);
  }

  synchronized String complete(String line, int mode) {
    return matcher.complete(mode, line == null ? "" : line);
  }

  /**
   * Runs a line; {@code column} is where the line starts on the terminal, for the caret. A line a
   * block mode does not know is tried as a global configuration command, which leaves the block.
   */
  private void execute(String line, int mode, String context, Reply reply, int column) {
    Outcome outcome = matcher.match(mode, line);
    if (outcome.failure() != null && mode >= CliData.INTERFACE) {
      Outcome global = matcher.match(CliData.CONFIG, line);
      if (global.match() != null) {
        reply.level(CliData.CONFIG);
        run(global.match(), CliData.CONFIG, "", line, reply, column);
        return;
      }
    }
    if (outcome.failure() != null) {
      reply.response(failure(outcome, line, column));
      return;
    }
    run(outcome.match(), mode, context, line, reply, column);
  }

  private static String failure(Outcome outcome, String line, int column) {
    return switch (outcome.failure()) {
      case INVALID -> " ".repeat(column + outcome.position()) + "^\n" + INVALID_INPUT;
      case INCOMPLETE -> INCOMPLETE;
      case AMBIGUOUS -> "% Ambiguous command:  \"" + line + "\"";
    };
  }

  private void run(Match match, int mode, String context, String line, Reply reply, int column) {
    Command command = match.command();
    List<String> arguments = match.arguments();
    String block = mode >= CliData.INTERFACE && !context.isEmpty() ? context : null;
    switch (command.action()) {
      case OUTPUT -> reply.response(output(command));
      case MODE -> enterMode(match, reply);
      case RUNNING_CONFIG -> reply.response(ShowText.runningConfig(config()));
      case STARTUP_CONFIG -> reply.response(ShowText.startupConfig(
          startup != null ? startup : RunningConfig.of(data.configuration(), initialName)));
      case INTERFACES -> reply.response(ShowText.interfaces(config().interfaces(),
          arguments.isEmpty() ? null : arguments.get(0), address));
      case IP_INTERFACE_BRIEF -> reply.response(ShowText.ipInterfaceBrief(config().interfaces()));
      case WRITE -> {
        startup = config().copy();
        reply.response("Building configuration...\n[OK]");
      }
      case HOSTNAME -> rename(arguments.get(0), reply);
      case SET -> config().store(block, command.key(), match.canonical());
      case ADD -> config().store(block, null, match.canonical());
      case NO -> negate(arguments.get(0), mode, block, line, reply, column);
      case EXIT -> reply.level(mode <= CliData.ENABLE ? CLOSING : mode == CliData.CONFIG ? CliData.ENABLE : CliData.CONFIG);
      case END -> reply.level(CliData.ENABLE);
      case LOGOUT -> reply.level(CLOSING);
      case DO -> {
        Reply inner = new Reply();
        String rest = arguments.get(0);
        execute(rest, CliData.ENABLE, "", inner, column + restStart(line, rest));
        inner.responses().forEach(reply::response);
      }
      case SILENT -> { }
    }
  }

  private void enterMode(Match match, Reply reply) {
    Command command = match.command();
    if (!command.output().isEmpty()) {
      reply.response(output(command));
    }
    reply.level(command.targetMode());
    if (command.opensBlock()) {
      config().openBlock(match.canonical());
      reply.add("context", match.canonical());
    }
  }

  /**
   * {@code no ...}: removes what the rest of the line names: a block, the line with a command's key
   * ({@code no description}), or the line itself ({@code no shutdown}); a hostname goes back to the
   * default. What is not there is not an error.
   */
  private void negate(String rest, int mode, String block, String line, Reply reply, int column) {
    Outcome outcome = matcher.match(mode, rest);
    Match target = outcome.match() != null ? outcome.match() : matcher.keyMatch(mode, rest);
    if (target == null && mode >= CliData.INTERFACE) {
      Outcome global = matcher.match(CliData.CONFIG, rest);
      target = global.match() != null ? global.match() : matcher.keyMatch(CliData.CONFIG, rest);
      if (target != null) {
        reply.level(CliData.CONFIG);
        block = null;
      }
    }
    if (target == null) {
      if (outcome.failure() == CliMatcher.Failure.INVALID) {
        outcome = new Outcome(null, outcome.failure(), restStart(line, rest) + outcome.position());
      }
      reply.response(failure(outcome, line, column));
      return;
    }
    Command command = target.command();
    if (command.action() == Action.HOSTNAME) {
      rename(RunningConfig.DEFAULT_HOSTNAME, reply);
    } else if (command.opensBlock()) {
      config().removeBlock(target.canonical());
    } else if (command.action() == Action.SET) {
      config().remove(block, command.key(), true);
    } else if (command.action() == Action.ADD) {
      config().remove(block, target.canonical(), false);
    }
  }

  private void rename(String newName, Reply reply) {
    config().setHostname(newName);
    name = newName;
    reply.add("devicename", newName);
  }

  /** Where the rest of a line (its last words, as a LINE placeholder takes them) starts in it. */
  private static int restStart(String line, String rest) {
    return line.stripTrailing().length() - rest.length();
  }

  private String output(Command command) {
    return String.join("\n", command.output()).replace("{hostname}", name);
  }

  private int promptLength(int mode) {
    return name.length() + data.promptSuffix(mode).length();
  }

  private RunningConfig config() {
    if (running == null) {
      running = RunningConfig.of(data.configuration(), initialName);
    }
    return running;
  }
}
