package com.kestrelon.simulator.tessel.control;

import com.kestrelon.simulator.tessel.data.ValueText;
import java.io.IOException;
import java.net.InetAddress;
import java.net.URI;
import java.net.URISyntaxException;
import java.net.UnknownHostException;
import java.nio.charset.StandardCharsets;
import java.nio.file.Files;
import java.nio.file.Path;
import java.security.MessageDigest;
import java.security.NoSuchAlgorithmException;
import java.util.Locale;
import java.util.Optional;

/**
 * Who may use the control interface. A page a browser loads from elsewhere must not drive it: the
 * Host header names this server by a loopback name or an address literal (a DNS-rebinding page
 * names its own host), a state-changing request from a page comes from this server's own origin,
 * and with a token every API request carries it.
 */
final class AdminAccess {
  static final int MIN_TOKEN_LENGTH = 16;

  private final InetAddress listening;
  private final Optional<byte[]> tokenDigest;

  AdminAccess(InetAddress listening, Optional<String> token) {
    this.listening = listening;
    this.tokenDigest = token.map(AdminAccess::digest);
  }

  boolean tokenRequired() {
    return tokenDigest.isPresent();
  }

  /**
   * True when the Host header names this server: localhost, a loopback address, the address it
   * listens on or the one this connection reached, each with or without a port.
   */
  boolean hostAllowed(String hostHeader, InetAddress reached) {
    Optional<String> host = hostPart(hostHeader);
    if (host.isEmpty()) {
      return false;
    }
    if (host.get().toLowerCase(Locale.ROOT).equals("localhost")) {
      return true;
    }
    Optional<InetAddress> literal = addressLiteral(host.get());
    return literal.isPresent()
        && (literal.get().isLoopbackAddress() || literal.get().equals(listening) || literal.get().equals(reached));
  }

  /** True when a browser's Origin header is absent or names the host the request was sent to. */
  static boolean originAllowed(String originHeader, String hostHeader) {
    if (originHeader == null) {
      return true;
    }
    try {
      URI origin = new URI(originHeader);
      return origin.getRawAuthority() != null && origin.getRawAuthority().equalsIgnoreCase(hostHeader)
          && ("http".equals(origin.getScheme()) || "https".equals(origin.getScheme()));
    } catch (URISyntaxException e) {
      return false;
    }
  }

  /** True when no token is set or the Authorization header carries it. */
  boolean authorized(String authorization) {
    if (tokenDigest.isEmpty()) {
      return true;
    }
    String prefix = "Bearer ";
    if (authorization == null || !authorization.regionMatches(true, 0, prefix, 0, prefix.length())) {
      return false;
    }
    // Both sides are digested first, so the comparison takes the same time whatever the length.
    return MessageDigest.isEqual(digest(authorization.substring(prefix.length()).trim()), tokenDigest.get());
  }

  /** The token a file holds, surrounding whitespace removed. */
  static String readToken(Path file) throws AdminConfigException {
    String token;
    try {
      token = Files.readString(file, StandardCharsets.UTF_8).strip();
    } catch (IOException e) {
      throw new AdminConfigException("cannot read the admin token file " + file + ": " + e.getMessage());
    }
    if (token.length() < MIN_TOKEN_LENGTH) {
      throw new AdminConfigException("the admin token in " + file + " has " + token.length()
          + " characters; it needs at least " + MIN_TOKEN_LENGTH);
    }
    return token;
  }

  /** Refuses to serve on an address other machines can reach without a token. */
  static void checkListen(InetAddress address, Optional<String> token) throws AdminConfigException {
    if (token.isEmpty() && !address.isLoopbackAddress()) {
      throw new AdminConfigException("the control interface listens on " + address.getHostAddress()
          + ", which is not a loopback address: give it a token with --admin-token-file FILE");
    }
  }

  /** The host of a Host header without its port; empty when the header is not host[:port]. */
  static Optional<String> hostPart(String header) {
    if (header == null || header.isEmpty()) {
      return Optional.empty();
    }
    String host = header;
    String port = "";
    if (header.startsWith("[")) {
      int close = header.indexOf(']');
      if (close < 0) {
        return Optional.empty();
      }
      host = header.substring(0, close + 1);
      port = header.substring(close + 1);
    } else if (header.indexOf(':') >= 0) {
      host = header.substring(0, header.indexOf(':'));
      port = header.substring(header.indexOf(':'));
    }
    boolean portValid = port.isEmpty() || port.matches(":[0-9]{1,5}");
    return portValid && !host.isEmpty() ? Optional.of(host) : Optional.empty();
  }

  /** The address a literal names ([v6] or dotted v4); never a name lookup. */
  static Optional<InetAddress> addressLiteral(String host) {
    try {
      if (host.startsWith("[") && host.endsWith("]")) {
        String inner = host.substring(1, host.length() - 1);
        // Only hex digits, colons and dots: InetAddress then parses it without asking DNS.
        return inner.matches("[0-9A-Fa-f:.]+") && inner.contains(":")
            ? Optional.of(InetAddress.getByName(inner))
            : Optional.empty();
      }
      return Optional.of(InetAddress.getByAddress(ValueText.parseIpAddress(host)));
    } catch (IllegalArgumentException | UnknownHostException e) {
      return Optional.empty();
    }
  }

  private static byte[] digest(String text) {
    try {
      return MessageDigest.getInstance("SHA-256").digest(text.getBytes(StandardCharsets.UTF_8));
    } catch (NoSuchAlgorithmException e) {
      throw new IllegalStateException("every JDK has SHA-256", e);
    }
  }
}
