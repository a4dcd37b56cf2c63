package com.kestrelon.simulator.tessel.snmp;

import com.kestrelon.simulator.tessel.data.Oid;
import java.io.IOException;
import java.nio.charset.StandardCharsets;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.HashMap;
import java.util.List;
import java.util.Map;
import java.util.Set;
import java.util.function.ToIntFunction;

/**
 * An SNMPv3 configuration: USM users and the VACM contexts, groups, access rows and view
 * families, read from a text file and handed to the engine row by row. Immutable.
 *
 * <p>One directive a line, its tokens separated by blanks; a token {@code ""} is the empty string
 * (the only quoting), and a token starting with {@code #} begins a comment that runs to the end of
 * the line:
 * <pre>
 *   user NAME AUTH AUTHPASS PRIV PRIVPASS
 *   context NAME
 *   group MODEL SECURITYNAME GROUP
 *   access GROUP CONTEXTPREFIX MODEL LEVEL MATCH READVIEW WRITEVIEW NOTIFYVIEW
 *   view NAME SUBTREE MASK TYPE
 * </pre>
 * AUTH is NO_AUTH, MD5_AUTH or SHA_AUTH; PRIV is NO_PRIV, CBC_DES or CFB_AES_128; a password is
 * {@code -} under a NO_ protocol and has at least 8 characters otherwise, and privacy needs
 * authentication. LEVEL is 0, 1 or 3 (noAuthNoPriv, authNoPriv, authPriv); MATCH 1 (exact) or 2
 * (prefix); MASK 0 to 16 hex digits (missing bits count as 1); TYPE 1 (included) or 2 (excluded).
 * An empty view name in an access row grants nothing.
 */
public final class SnmpV3Config {
  /** Rows are kept across restarts of the engine's service. */
  static final int STORAGE_NON_VOLATILE = 3;
  /** Reports then carry the agent's boots and time, which managers use to synchronise. */
  static final int DISCOVERY_TIME_FLAG = 1;

  private static final int MAX_NAME = 32;
  private static final int MIN_PASSWORD = 8;
  private static final Set<String> AUTH_PROTOCOLS = Set.of("NO_AUTH", "MD5_AUTH", "SHA_AUTH");
  private static final Set<String> PRIV_PROTOCOLS = Set.of("NO_PRIV", "CBC_DES", "CFB_AES_128");

  /** One directive with the line it came from. */
  public sealed interface Row permits User, Context, Group, Access, View {
    int line();

    /** Hands the row to the engine: 1 added, 0 refused, 99 out of memory. */
    int addTo(SerToCConverter engine);
  }

  /** A USM user; the password of a NO_ protocol is empty. */
  public record User(int line, String name, String authProtocol, String authPassword,
      String privProtocol, String privPassword) implements Row {
    @Override
    public int addTo(SerToCConverter engine) {
      return engine.nativeAddUsmUserEntry(name, authProtocol, authPassword, privProtocol,
          privPassword, DISCOVERY_TIME_FLAG);
    }
  }

  public record Context(int line, String name) implements Row {
    @Override
    public int addTo(SerToCConverter engine) {
      return engine.nativeAddContextEntry(name);
    }
  }

  public record Group(int line, int model, String securityName, String group) implements Row {
    @Override
    public int addTo(SerToCConverter engine) {
      return engine.nativeAddSecurityToGroupEntry(model, securityName, group, 0,
          STORAGE_NON_VOLATILE);
    }
  }

  public record Access(int line, String group, String contextPrefix, int model, int level,
      int match, String readView, String writeView, String notifyView) implements Row {
    @Override
    public int addTo(SerToCConverter engine) {
      return engine.nativeAddAccessEntry(group, contextPrefix, model, level, match, readView,
          writeView, notifyView, STORAGE_NON_VOLATILE, 0);
    }
  }

  public record View(int line, String name, String subtree, String mask, int type) implements Row {
    @Override
    public int addTo(SerToCConverter engine) {
      return engine.nativeAddViewTreeEntry(name, subtree, mask, type, STORAGE_NON_VOLATILE, 0);
    }
  }

  private final String file;
  private final List<Row> rows;

  private SnmpV3Config(String file, List<Row> rows) {
    this.file = file;
    this.rows = List.copyOf(rows);
  }

  public static SnmpV3Config load(Path path) throws IOException, SnmpV3ConfigException {
    return parse(path.toString(), Files.readString(path, StandardCharsets.UTF_8));
  }

  /** Reads a configuration; {@code file} names it in error messages. */
  public static SnmpV3Config parse(String file, String text) throws SnmpV3ConfigException {
    List<Row> rows = new ArrayList<>();
    Map<String, Integer> users = new HashMap<>();
    List<String> lines = text.lines().toList();
    for (int i = 0; i < lines.size(); i++) {
      int line = i + 1;
      LineReader reader = new LineReader(file, line, lines.get(i));
      if (reader.tokens.isEmpty()) {
        continue;
      }
      Row row = reader.row();
      if (row instanceof User user) {
        Integer earlier = users.putIfAbsent(user.name(), line);
        if (earlier != null) {
          throw new SnmpV3ConfigException(file, line,
              "user '" + user.name() + "' is already defined at line " + earlier);
        }
      }
      rows.add(row);
    }
    return new SnmpV3Config(file, rows);
  }

  public List<Row> rows() {
    return rows;
  }

  /**
   * Hands every row to the engine in file order, then rebuilds the engine's access and view
   * decision lists. Stops at the first row the engine does not add.
   */
  public void apply(SerToCConverter engine) throws SnmpV3ConfigException {
    apply(row -> row.addTo(engine), engine::nativeCreateLCDVectors);
  }

  /** As {@link #apply(SerToCConverter)}, with {@code add} adding a row and {@code rebuild} the lists. */
  void apply(ToIntFunction<Row> add, Runnable rebuild) throws SnmpV3ConfigException {
    for (Row row : rows) {
      int result = add.applyAsInt(row);
      if (result != 1) {
        throw new SnmpV3ConfigException(file, row.line(), result == 99
            ? "the engine ran out of memory" : "the engine refused this row");
      }
    }
    rebuild.run();
  }

  /** The tokens of one line and the checks of their values. */
  private static final class LineReader {
    final String file;
    final int line;
    final List<String> tokens = new ArrayList<>();

    LineReader(String file, int line, String text) throws SnmpV3ConfigException {
      this.file = file;
      this.line = line;
      for (String token : text.strip().split("[ \t]+")) {
        if (token.isEmpty()) {
          continue;
        }
        if (token.startsWith("#")) {
          break;
        }
        if (token.equals("\"\"")) {
          token = "";
        } else if (token.indexOf('"') >= 0) {
          throw fault("a quote may only appear as \"\", the empty string: " + token);
        }
        tokens.add(token);
      }
    }

    SnmpV3ConfigException fault(String reason) {
      return new SnmpV3ConfigException(file, line, reason);
    }

    Row row() throws SnmpV3ConfigException {
      String directive = tokens.get(0);
      return switch (directive) {
        case "user" -> {
          expect("NAME AUTH AUTHPASS PRIV PRIVPASS");
          String auth = protocol(2, AUTH_PROTOCOLS, "authentication");
          String priv = protocol(4, PRIV_PROTOCOLS, "privacy");
          if (auth.equals("NO_AUTH") && !priv.equals("NO_PRIV")) {
            throw fault("privacy needs authentication: NO_AUTH with " + priv);
          }
          yield new User(line, name(1, "user name", 1), auth, password(3, auth), priv,
              password(5, priv));
        }
        case "context" -> {
          expect("NAME");
          yield new Context(line, name(1, "context name", 0));
        }
        case "group" -> {
          expect("MODEL SECURITYNAME GROUP");
          yield new Group(line, number(1, "security model", 1, 2, 3),
              name(2, "security name", 1), name(3, "group name", 1));
        }
        case "access" -> {
          expect("GROUP CONTEXTPREFIX MODEL LEVEL MATCH READVIEW WRITEVIEW NOTIFYVIEW");
          yield new Access(line, name(1, "group name", 1), name(2, "context prefix", 0),
              number(3, "security model", 0, 1, 2, 3), number(4, "level", 0, 1, 3),
              number(5, "match", 1, 2), name(6, "read view", 0), name(7, "write view", 0),
              name(8, "notify view", 0));
        }
        case "view" -> {
          expect("NAME SUBTREE MASK TYPE");
          yield new View(line, name(1, "view name", 1), subtree(2), mask(3),
              number(4, "type", 1, 2));
        }
        default -> throw fault("unknown directive '" + directive + "'");
      };
    }

    void expect(String form) throws SnmpV3ConfigException {
      int wanted = form.split(" ").length;
      if (tokens.size() - 1 != wanted) {
        throw fault("'" + tokens.get(0) + "' takes " + wanted + " values (" + form + "), not "
            + (tokens.size() - 1));
      }
    }

    String name(int index, String what, int shortest) throws SnmpV3ConfigException {
      String name = tokens.get(index);
      if (name.length() < shortest || name.length() > MAX_NAME) {
        throw fault("the " + what + " must have " + shortest + " to " + MAX_NAME
            + " characters: '" + name + "'");
      }
      return name;
    }

    String protocol(int index, Set<String> known, String what) throws SnmpV3ConfigException {
      String protocol = tokens.get(index);
      if (!known.contains(protocol)) {
        throw fault("unknown " + what + " protocol '" + protocol + "' (one of "
            + String.join(", ", known.stream().sorted().toList()) + ")");
      }
      return protocol;
    }

    /** The password after a protocol: "-" under NO_AUTH or NO_PRIV, handed on as "". */
    String password(int index, String protocol) throws SnmpV3ConfigException {
      String password = tokens.get(index);
      if (protocol.startsWith("NO_")) {
        if (!password.equals("-")) {
          throw fault("the password after " + protocol + " must be '-'");
        }
        return "";
      }
      if (password.length() < MIN_PASSWORD) {
        throw fault("the " + protocol + " password needs at least " + MIN_PASSWORD
            + " characters");
      }
      return password;
    }

    int number(int index, String what, int... allowed) throws SnmpV3ConfigException {
      String text = tokens.get(index);
      for (int value : allowed) {
        if (text.equals(Integer.toString(value))) {
          return value;
        }
      }
      StringBuilder choices = new StringBuilder();
      for (int i = 0; i < allowed.length; i++) {
        choices.append(i == 0 ? "" : i == allowed.length - 1 ? " or " : ", ").append(allowed[i]);
      }
      throw fault("the " + what + " must be " + choices + ", not '" + text + "'");
    }

    String subtree(int index) throws SnmpV3ConfigException {
      String text = tokens.get(index);
      try {
        Oid.parse(text);
      } catch (IllegalArgumentException e) {
        throw fault("the subtree must be a dotted OID such as 1.3.6.1, not '" + text + "'");
      }
      return text.startsWith(".") ? text.substring(1) : text;
    }

    String mask(int index) throws SnmpV3ConfigException {
      String mask = tokens.get(index);
      if (!mask.matches("[0-9A-Fa-f]{0,16}")) {
        throw fault("the mask must be 0 to 16 hex digits, not '" + mask + "'");
      }
      return mask;
    }
  }
}
