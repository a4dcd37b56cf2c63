#include "transport/telnet.h"

#include <algorithm>
#include <cctype>

namespace tessel {
namespace {

void AppendCommand(std::string* out, std::uint8_t verb, std::uint8_t option) {
  out->push_back(static_cast<char>(kTelnetIac));
  out->push_back(static_cast<char>(verb));
  out->push_back(static_cast<char>(option));
}

// IAC SB TERMINAL-TYPE SEND IAC SE.
constexpr std::string_view kSendTerminalType = "\xff\xfa\x18\x01\xff\xf0";

// A client that sends this much in its first read types whole lines, not single keys.
constexpr std::size_t kLineAtOnce = 3;

}  // namespace

std::string TelnetInput::Open() {
  std::string offer;
  for (std::uint8_t option : {kTelnetEcho, kTelnetSuppressGoAhead}) {
    server_[option] = Option::kOffered;
    AppendCommand(&offer, kTelnetWill, option);
  }
  return offer;
}

std::string TelnetInput::OpenAskingTerminalType() {
  commandLine_ = true;
  negotiation_ = Negotiation::kPending;
  client_[kTelnetTerminalType] = Option::kOffered;
  std::string request;
  AppendCommand(&request, kTelnetDo, kTelnetTerminalType);
  return request;
}

void TelnetInput::GiveUpNegotiation() {
  if (negotiation_ == Negotiation::kPending) negotiation_ = Negotiation::kNotNegotiated;
}

// A client that names a terminal is offered what a terminal needs; one without (or a dumb one)
// is served as it is.
void TelnetInput::Settle(Negotiation negotiation, std::string* replies) {
  if (negotiation_ != Negotiation::kPending) return;
  negotiation_ = negotiation;
  if (negotiation != Negotiation::kNegotiated) return;
  for (std::uint8_t option : {kTelnetSuppressGoAhead, kTelnetEcho}) {
    if (server_[option] != Option::kOff) continue;
    server_[option] = Option::kOffered;
    AppendCommand(replies, kTelnetWill, option);
  }
}

TelnetFeed TelnetInput::Feed(std::string_view bytes) {
  TelnetFeed out;
  for (char c : bytes) {
    auto byte = static_cast<std::uint8_t>(c);
    switch (state_) {
      case State::kData:
      case State::kAfterCr:
        ReadData(byte, &out);
        break;
      case State::kCommand:
        ReadCommand(byte);
        if (state_ == State::kData && byte == kTelnetIac) out.data.push_back(c);
        break;
      case State::kOptionName:
        ReadOptionRequest(byte, &out.replies);
        break;
      case State::kSubnegotiation:
        if (byte == kTelnetIac) {
          state_ = State::kSubnegotiationCommand;
        } else if (subnegotiation_.size() < kSubnegotiationLimit) {
          subnegotiation_.push_back(c);  // bytes past the limit are dropped
        }
        break;
      case State::kSubnegotiationCommand:
        if (byte == kTelnetSubnegotiationEnd) {
          state_ = State::kData;
          EndSubnegotiation(&out.replies);
        } else if (byte == kTelnetIac) {
          state_ = State::kSubnegotiation;  // an escaped 0xFF inside the parameters
          if (subnegotiation_.size() < kSubnegotiationLimit) subnegotiation_.push_back(c);
        } else {
          ReadCommand(byte);  // a command without IAC SE ends the subnegotiation too
        }
        break;
    }
  }
  if (firstDataLength_ == 0) firstDataLength_ = out.data.size();
  return out;
}

// TERMINAL-TYPE IS name, once the client agreed to tell it; other parameters are not used.
void TelnetInput::EndSubnegotiation(std::string* replies) {
  std::string_view parameters = subnegotiation_;
  if (!commandLine_ || client_[kTelnetTerminalType] != Option::kOn || parameters.size() < 2 ||
      static_cast<std::uint8_t>(parameters[0]) != kTelnetTerminalType || parameters[1] != '\0')
    return;
  terminalType_.clear();
  for (char c : parameters.substr(2, kTerminalTypeLimit))
    terminalType_.push_back(static_cast<char>(std::tolower(static_cast<unsigned char>(c))));
  Settle(terminalType_ == "dumb" ? Negotiation::kNotNegotiated : Negotiation::kNegotiated, replies);
}

void TelnetInput::ReadData(std::uint8_t byte, TelnetFeed* out) {
  bool afterCr = state_ == State::kAfterCr;
  state_ = State::kData;
  if (byte == kTelnetIac) {
    state_ = State::kCommand;
  } else if (afterCr && (byte == '\0' || byte == '\n')) {
    // the second byte of a line end: the CR already stands for it
  } else {
    out->data.push_back(static_cast<char>(byte));
    if (byte == '\r') state_ = State::kAfterCr;
    // Data before any answer: a client that takes no part in negotiation.
    if (commandLine_ && client_[kTelnetTerminalType] == Option::kOffered)
      Settle(Negotiation::kNotNegotiated, &out->replies);
  }
}

// The byte after IAC (IAC IAC itself is handled by the caller, which owns the data).
void TelnetInput::ReadCommand(std::uint8_t byte) {
  switch (byte) {
    case kTelnetWill:
    case kTelnetWont:
    case kTelnetDo:
    case kTelnetDont:
      verb_ = byte;
      state_ = State::kOptionName;
      break;
    case kTelnetSubnegotiation:
      state_ = State::kSubnegotiation;  // parameters kept up to IAC SE
      subnegotiation_.clear();
      break;
    default:
      state_ = State::kData;  // IAC IAC, and commands without effect here (NOP, GA, AYT, ...)
      break;
  }
}

void TelnetInput::ReadOptionRequest(std::uint8_t option, std::string* replies) {
  state_ = State::kData;
  if (verb_ == kTelnetDo || verb_ == kTelnetDont)
    AnswerServerOption(option, verb_ == kTelnetDo, replies);
  else
    AnswerClientOption(option, verb_ == kTelnetWill, replies);
}

// An answer is sent only when the request changes the option's state: a request for the state
// the option is already in, or the answer to an offer of ours, is not answered. So two ends that
// follow the same rule cannot loop.
void TelnetInput::AnswerServerOption(std::uint8_t option, bool enable, std::string* replies) {
  Option& state = server_[option];
  bool supported = option == kTelnetEcho || option == kTelnetSuppressGoAhead;
  if (state == Option::kOffered) {
    state = enable ? Option::kOn : Option::kOff;
  } else if (enable && state == Option::kOff) {
    if (supported) state = Option::kOn;
    AppendCommand(replies, supported ? kTelnetWill : kTelnetWont, option);
  } else if (!enable && state == Option::kOn) {
    state = Option::kOff;
    if (!commandLine_) AppendCommand(replies, kTelnetWont, option);
  }
}

// The client may suppress go-ahead on its side; any other option of its own is refused (its
// ECHO above all: two ends echoing each other would loop every character).
void TelnetInput::AnswerClientOption(std::uint8_t option, bool enable, std::string* replies) {
  Option& state = client_[option];
  bool supported = option == kTelnetSuppressGoAhead;
  if (state == Option::kOffered) {  // the answer to asking for the terminal type
    state = enable ? Option::kOn : Option::kOff;
    if (!enable) {
      Settle(Negotiation::kNotNegotiated, replies);
      return;
    }
    replies->append(kSendTerminalType);
  } else if (enable && state == Option::kOff) {
    if (supported) state = Option::kOn;
    AppendCommand(replies, supported ? kTelnetDo : kTelnetDont, option);
  } else if (!enable && state == Option::kOn) {
    state = Option::kOff;
    if (!commandLine_) AppendCommand(replies, kTelnetDont, option);
  }
}

bool TelnetInput::ServerEchoes() const {
  if (commandLine_ && negotiation_ != Negotiation::kNegotiated)
    return firstDataLength_ > 0 && firstDataLength_ < kLineAtOnce;
  switch (server_[kTelnetEcho]) {
    case Option::kOn:
      return true;
    case Option::kOff:
      return false;
    case Option::kOffered:
      break;
  }
  return firstDataLength_ < kLineAtOnce;
}

std::string EscapeTelnetData(std::string_view bytes) {
  std::string out;
  out.reserve(bytes.size());
  for (char c : bytes) {
    out.push_back(c);
    if (static_cast<std::uint8_t>(c) == kTelnetIac) out.push_back(c);
  }
  return out;
}

}  // namespace tessel
