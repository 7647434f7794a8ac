#include "cli/Console.h"

#include <sys/ioctl.h>
#include <unistd.h>

#include <cstdlib>
#include <iostream>

#include "platform/foundation/Text.h"

namespace kx::cli {

namespace {

constexpr const char* kBold = "\x1b[1m";
constexpr const char* kRed = "\x1b[31m";
constexpr const char* kYellow = "\x1b[33m";
constexpr const char* kReset = "\x1b[0m";
constexpr const char* kEraseLine = "\r\x1b[K";

bool colorsWanted() {
  const char* noColor = std::getenv("NO_COLOR");
  if (noColor != nullptr && *noColor != '\0') return false;
  const char* terminal = std::getenv("TERM");
  return terminal != nullptr && std::string_view(terminal) != "dumb";
}

bool startsCodePoint(char byte) { return (static_cast<unsigned char>(byte) & 0xC0) != 0x80; }

std::string_view cut(std::string_view text, std::size_t columns) {
  std::size_t seen = 0;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (startsCodePoint(text[i]) && ++seen > columns) return text.substr(0, i);
  }
  return text;
}

// Bytes at the start of UTF-8 text that must not reach a terminal although they are valid text:
// line breaks, the controls above U+007F, and marks that turn the direction of what follows.
std::size_t unsafeLength(std::string_view text) {
  const auto byte = [&](std::size_t i) {
    return i < text.size() ? static_cast<unsigned char>(text[i]) : 0U;
  };
  if (byte(0) < 0x20 || byte(0) == 0x7F) return 1;
  if (byte(0) == 0xC2 && byte(1) >= 0x80 && byte(1) <= 0x9F) return 2;
  if (byte(0) != 0xE2) return 0;
  const bool breaksOrTurns = byte(1) == 0x80 && byte(2) >= 0xA8 && byte(2) <= 0xAE;
  const bool isolates = byte(1) == 0x81 && byte(2) >= 0xA6 && byte(2) <= 0xA9;
  return breaksOrTurns || isolates ? 3 : 0;
}

void appendHex(std::string& out, char byte) {
  constexpr const char* kDigits = "0123456789abcdef";
  const auto value = static_cast<unsigned char>(byte);
  out += "\\x";
  out += kDigits[value >> 4U];
  out += kDigits[value & 0xFU];
}

}  // namespace

Console::Setup Console::processSetup() {
  Setup setup;
  setup.out = &std::cout;
  setup.err = &std::cerr;
  setup.errIsTerminal = ::isatty(STDERR_FILENO) == 1;
  setup.outIsTerminal = ::isatty(STDOUT_FILENO) == 1;
  const bool colors = colorsWanted();
  setup.colorOut = colors && ::isatty(STDOUT_FILENO) == 1;
  setup.colorErr = colors && setup.errIsTerminal;
  winsize size{};
  if (setup.errIsTerminal && ::ioctl(STDERR_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0) {
    setup.errColumns = size.ws_col;
  }
  return setup;
}

void Console::withoutColor() {
  std::lock_guard<std::mutex> lock(mutex_);
  setup_.colorOut = false;
  setup_.colorErr = false;
}

void Console::result(std::string_view line) {
  std::lock_guard<std::mutex> lock(mutex_);
  clearProgress();
  *setup_.out << printable(line) << '\n';
}

void Console::heading(std::string_view line) {
  std::lock_guard<std::mutex> lock(mutex_);
  clearProgress();
  if (setup_.colorOut) *setup_.out << kBold;
  *setup_.out << printable(line);
  if (setup_.colorOut) *setup_.out << kReset;
  *setup_.out << '\n';
}

void Console::raw(std::string_view text) {
  std::lock_guard<std::mutex> lock(mutex_);
  setup_.out->write(text.data(), static_cast<std::streamsize>(text.size()));
}

void Console::errLine(std::string_view prefix, const char* color, std::string_view text) {
  std::lock_guard<std::mutex> lock(mutex_);
  clearProgress();
  if (setup_.colorErr && color != nullptr) {
    *setup_.err << color << prefix << kReset;
  } else {
    *setup_.err << prefix;
  }
  *setup_.err << printable(text) << '\n';
}

void Console::error(std::string_view message) { errLine("kxsync: ", kRed, message); }
void Console::warning(std::string_view message) { errLine("kxsync: ", kYellow, message); }
void Console::hint(std::string_view message) { errLine("", nullptr, message); }

// A message of several lines is indented after its first, so that none can pass for another.
void Console::log(std::string_view message) {
  const char* indent = "";
  while (true) {
    const std::size_t end = message.find('\n');
    errLine(indent, nullptr, message.substr(0, end));
    if (end == std::string_view::npos) return;
    message.remove_prefix(end + 1);
    indent = "    ";
  }
}

void Console::progress(std::string_view line) {
  std::lock_guard<std::mutex> lock(mutex_);
  if (!setup_.errIsTerminal) return;
  const auto columns = static_cast<std::size_t>(setup_.errColumns > 1 ? setup_.errColumns - 1 : 1);
  const std::string text = printable(line);
  *setup_.err << kEraseLine << cut(text, columns) << std::flush;
  progressShown_ = true;
}

void Console::endProgress() {
  std::lock_guard<std::mutex> lock(mutex_);
  clearProgress();
}

void Console::clearProgress() {
  if (!progressShown_) return;
  *setup_.err << kEraseLine << std::flush;
  progressShown_ = false;
}

bool Console::finish() {
  std::lock_guard<std::mutex> lock(mutex_);
  clearProgress();
  setup_.err->flush();
  setup_.out->flush();
  return setup_.out->good();
}

std::string printable(std::string_view text) {
  const std::string escaped = escapeControlCharacters(text);
  std::string out;
  out.reserve(escaped.size());
  for (std::size_t i = 0; i < escaped.size();) {
    const std::size_t length = unsafeLength(std::string_view(escaped).substr(i));
    if (length == 0) {
      out += escaped[i++];
      continue;
    }
    for (std::size_t end = i + length; i < end; ++i) appendHex(out, escaped[i]);
  }
  return out;
}

std::size_t columnsOf(std::string_view text) {
  std::size_t columns = 0;
  for (char byte : text) columns += startsCodePoint(byte) ? 1U : 0U;
  return columns;
}

std::string shortened(std::string_view text, std::size_t columns) {
  if (columnsOf(text) <= columns) return std::string(text);
  return std::string(cut(text, columns - 3)) + "...";
}

std::string padded(std::string_view text, std::size_t columns) {
  std::string out(text);
  const std::size_t have = columnsOf(text);
  if (have < columns) out.append(columns - have, ' ');
  return out;
}

}  // namespace kx::cli
