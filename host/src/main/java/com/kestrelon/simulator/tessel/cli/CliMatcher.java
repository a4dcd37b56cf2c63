package com.kestrelon.simulator.tessel.cli;

import com.kestrelon.simulator.tessel.cli.CliData.Command;
import com.kestrelon.simulator.tessel.cli.CliData.Token;
import java.util.ArrayList;
import java.util.Comparator;
import java.util.LinkedHashMap;
import java.util.LinkedHashSet;
import java.util.List;
import java.util.Locale;
import java.util.Map;
import java.util.Set;

/**
 * Finds the command a typed line means among the commands of a mode, the way a router's parser
 * does: word by word, each keyword abbreviated to any prefix that no other keyword at that place
 * shares, a keyword preferred to a placeholder, interface names abbreviated to a unique prefix of
 * their type. Also answers the {@code ?} help and the TAB completion of a line. Stateless over
 * immutable data: any number of threads may use one matcher.
 */
final class CliMatcher {
  static final String UNRECOGNIZED = "% Unrecognized command";
  private static final String END_OF_COMMAND = "<cr>";

  enum Failure { INVALID, INCOMPLETE, AMBIGUOUS }

  /**
   * A command found: its canonical text (keywords in full, interface names expanded, the rest of
   * the line as typed) and the values of its placeholders in order.
   */
  record Match(Command command, String canonical, List<String> arguments) {}

  /**
   * What a line means: a match, or a failure; for INVALID, {@code position} is the index in the
   * line of the first character no command accepts.
   */
  record Outcome(Match match, Failure failure, int position) {}

  private record Word(String text, int start) {}

  /** A command still in the running, with what the words so far made of it. */
  private record Candidate(Command command, int next, boolean rest, List<String> parts, List<String> arguments) {
    Token token() {
      return next < command.tokens().size() ? command.tokens().get(next) : null;
    }

    boolean complete() {
      return rest || command.tokens().subList(next, command.tokens().size()).stream().allMatch(Token::optional);
    }

    String lastPart() {
      return parts.get(parts.size() - 1);
    }

    Candidate take(String part, boolean argument, boolean line) {
      List<String> newParts = new ArrayList<>(parts);
      newParts.add(part);
      List<String> newArguments = new ArrayList<>(arguments);
      if (argument) {
        newArguments.add(part);
      }
      return new Candidate(command, next + 1, line, newParts, newArguments);
    }
  }

  /** The commands left after some words, or where and why they ran out. */
  private record Walk(List<Candidate> alive, Failure failure, int position) {}

  private final CliData data;

  CliMatcher(CliData data) {
    this.data = data;
  }

  /** The command a (non-blank) line means in a mode. */
  Outcome match(int mode, String line) {
    List<Word> words = words(line);
    Walk walk = walk(mode, line, words, words.size());
    if (walk.failure() != null) {
      return new Outcome(null, walk.failure(), walk.position());
    }
    for (Candidate candidate : walk.alive()) {
      if (candidate.complete()) {
        return new Outcome(new Match(candidate.command(), String.join(" ", candidate.parts()), candidate.arguments()),
            null, 0);
      }
    }
    return new Outcome(null, Failure.INCOMPLETE, line.length());
  }

  /**
   * The command whose key (its keywords before the first placeholder) the line gives in full and
   * nothing more, such as {@code desc} for {@code description LINE}; null when there is none.
   */
  Match keyMatch(int mode, String line) {
    List<Word> words = words(line);
    Walk walk = walk(mode, line, words, words.size());
    for (Candidate candidate : walk.alive()) {
      String canonical = String.join(" ", candidate.parts());
      if (!candidate.rest() && candidate.arguments().isEmpty() && canonical.equals(candidate.command().key())) {
        return new Match(candidate.command(), canonical, List.of());
      }
    }
    return null;
  }

  /**
   * The {@code ?} help for the line typed so far: after a space, what may come next; within a
   * word, the keywords it may be the start of; each with its one-line help.
   */
  String help(int mode, String line) {
    List<Word> words = words(line);
    boolean partial = !line.isEmpty() && !Character.isWhitespace(line.charAt(line.length() - 1));
    Walk walk = walk(mode, line, words, partial ? words.size() - 1 : words.size());
    if (walk.failure() != null) {
      return UNRECOGNIZED;
    }
    Map<String, String> keywords = new LinkedHashMap<>();
    Map<String, String> placeholders = new LinkedHashMap<>();
    boolean end = false;
    String prefix = partial ? words.get(words.size() - 1).text().toLowerCase(Locale.ROOT) : "";
    for (Candidate candidate : walk.alive()) {
      Token token = candidate.rest() ? null : candidate.token();
      end |= !partial && candidate.complete();
      if (token == null) {
        continue;
      }
      if (!token.placeholder() && token.text().toLowerCase(Locale.ROOT).startsWith(prefix)) {
        keywords.putIfAbsent(token.text(), help(mode, candidate));
      } else if (token.placeholder() && !partial) {
        placeholders.putIfAbsent(token.text(), candidate.command().help());
      }
    }
    if (keywords.isEmpty() && placeholders.isEmpty() && !end) {
      return UNRECOGNIZED;
    }
    List<String[]> entries = new ArrayList<>();
    keywords.keySet().stream().sorted(Comparator.comparing(keyword -> keyword.toLowerCase(Locale.ROOT)))
        .forEach(keyword -> entries.add(new String[] {keyword, keywords.get(keyword)}));
    placeholders.forEach((name, text) -> entries.add(new String[] {name, text}));
    if (end) {
      entries.add(new String[] {END_OF_COMMAND, ""});
    }
    int width = entries.stream().mapToInt(entry -> entry[0].length()).max().orElse(0);
    List<String> lines = new ArrayList<>();
    for (String[] entry : entries) {
      String text = "  " + entry[0] + " ".repeat(width - entry[0].length()) + "  " + entry[1];
      lines.add(text.stripTrailing());
    }
    return String.join("\n", lines);
  }

  /**
   * The line with its last word completed when it starts exactly one keyword (then followed by a
   * space) or one interface type; else the line unchanged.
   */
  String complete(int mode, String line) {
    List<Word> words = words(line);
    if (words.isEmpty() || Character.isWhitespace(line.charAt(line.length() - 1))) {
      return line;
    }
    Word last = words.get(words.size() - 1);
    Walk walk = walk(mode, line, words, words.size() - 1);
    if (walk.failure() != null) {
      return line;
    }
    String prefix = last.text().toLowerCase(Locale.ROOT);
    Set<String> keywords = new LinkedHashSet<>();
    Set<String> types = new LinkedHashSet<>();
    for (Candidate candidate : walk.alive()) {
      Token token = candidate.rest() ? null : candidate.token();
      if (token != null && !token.placeholder() && token.text().toLowerCase(Locale.ROOT).startsWith(prefix)) {
        keywords.add(token.text());
      } else if (token != null && token.text().equals("INTERFACE") && prefix.matches("[a-z-]+")) {
        data.interfaceTypes().stream().filter(type -> type.toLowerCase(Locale.ROOT).startsWith(prefix))
            .forEach(types::add);
      }
    }
    String before = line.substring(0, last.start());
    if (keywords.size() == 1 && types.isEmpty()) {
      return before + keywords.iterator().next() + " ";
    }
    return keywords.isEmpty() && types.size() == 1 ? before + types.iterator().next() : line;
  }

  /** The help of the keyword a candidate is at: the file's help for that path, else the command's. */
  private String help(int mode, Candidate candidate) {
    List<String> path = new ArrayList<>();
    for (Token token : candidate.command().tokens().subList(0, candidate.next() + 1)) {
      path.add(token.text().toLowerCase(Locale.ROOT));
    }
    String own = data.help(mode, String.join(" ", path));
    return own != null ? own : candidate.command().help();
  }

  /** Takes the first {@code count} words, keeping the commands that accept each in turn. */
  private Walk walk(int mode, String line, List<Word> words, int count) {
    List<Candidate> alive = new ArrayList<>();
    for (Command command : data.commands(mode)) {
      alive.add(new Candidate(command, 0, false, List.of(), List.of()));
    }
    for (int i = 0; i < count; i++) {
      Word word = words.get(i);
      String typed = word.text().toLowerCase(Locale.ROOT);
      List<Candidate> byKeyword = new ArrayList<>();
      List<Candidate> byPlaceholder = new ArrayList<>();
      int furthest = 0;
      for (Candidate candidate : alive) {
        Token token = candidate.token();
        if (candidate.rest()) {
          byPlaceholder.add(candidate);
        } else if (token == null) {
          continue;
        } else if (!token.placeholder()) {
          String keyword = token.text().toLowerCase(Locale.ROOT);
          if (keyword.startsWith(typed)) {
            byKeyword.add(candidate.take(token.text(), false, false));
          } else {
            furthest = Math.max(furthest, commonPrefix(keyword, typed));
          }
        } else {
          String value = placeholderValue(token.text(), word, line);
          if (value != null) {
            byPlaceholder.add(candidate.take(value, true, token.isLine()));
          } else {
            furthest = Math.max(furthest, placeholderReach(token.text(), typed));
          }
        }
      }
      if (!byKeyword.isEmpty()) {
        Set<String> distinct = new LinkedHashSet<>();
        byKeyword.forEach(candidate -> distinct.add(candidate.lastPart().toLowerCase(Locale.ROOT)));
        if (distinct.size() > 1 && !distinct.contains(typed)) {
          return new Walk(List.of(), Failure.AMBIGUOUS, word.start());
        }
        alive = byKeyword.stream()
            .filter(candidate -> distinct.size() == 1 || candidate.lastPart().equalsIgnoreCase(typed)).toList();
      } else if (!byPlaceholder.isEmpty()) {
        alive = byPlaceholder;
      } else {
        return new Walk(List.of(), Failure.INVALID, word.start() + furthest);
      }
    }
    return new Walk(alive, null, 0);
  }

  /** The value a placeholder takes from a word (LINE: the rest of the line); null when it does not fit. */
  private String placeholderValue(String placeholder, Word word, String line) {
    return switch (placeholder) {
      case "NUMBER" -> word.text().matches("[0-9]{1,10}") ? word.text() : null;
      case "LINE" -> line.substring(word.start()).strip();
      case "INTERFACE" -> interfaceName(word.text());
      default -> word.text();
    };
  }

  /** How many characters of a word a placeholder that refused it accepted. */
  private int placeholderReach(String placeholder, String typed) {
    if (placeholder.equals("NUMBER")) {
      int digits = 0;
      while (digits < typed.length() && Character.isDigit(typed.charAt(digits))) {
        digits++;
      }
      return digits;
    }
    int reach = 0;
    for (String type : data.interfaceTypes()) {
      reach = Math.max(reach, commonPrefix(type.toLowerCase(Locale.ROOT), typed));
    }
    return reach;
  }

  /** The full name of an interface written as a unique prefix of its type and its number; null when none. */
  String interfaceName(String word) {
    int digit = 0;
    while (digit < word.length() && !Character.isDigit(word.charAt(digit))) {
      digit++;
    }
    String number = word.substring(digit);
    if (digit == 0 || !number.matches("[0-9][0-9/.:]*")) {
      return null;
    }
    String prefix = word.substring(0, digit).toLowerCase(Locale.ROOT);
    List<String> types = data.interfaceTypes().stream()
        .filter(type -> type.toLowerCase(Locale.ROOT).startsWith(prefix)).toList();
    String exact = types.stream().filter(type -> type.equalsIgnoreCase(prefix)).findFirst().orElse(null);
    if (exact != null) {
      return exact + number;
    }
    return types.size() == 1 ? types.get(0) + number : null;
  }

  private static int commonPrefix(String a, String b) {
    int length = 0;
    while (length < a.length() && length < b.length() && a.charAt(length) == b.charAt(length)) {
      length++;
    }
    return length;
  }

  private static List<Word> words(String line) {
    List<Word> words = new ArrayList<>();
    int i = 0;
    while (i < line.length()) {
      while (i < line.length() && Character.isWhitespace(line.charAt(i))) {
        i++;
      }
      int start = i;
      while (i < line.length() && !Character.isWhitespace(line.charAt(i))) {
        i++;
      }
      if (i > start) {
        words.add(new Word(line.substring(start, i), start));
      }
    }
    return words;
  }
}
