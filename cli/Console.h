#pragma once

#include <iosfwd>
#include <mutex>
#include <string>
#include <string_view>

namespace kx::cli {

// Where the program's words go: results to standard output; progress, problems and log lines to
// standard error. Control bytes of whatever is printed are escaped, so that a name from a host
// cannot drive the terminal. Any thread; outlives everything that prints.
class Console {
 public:
  struct Setup {
    std::ostream* out = nullptr;
    std::ostream* err = nullptr;
    bool errIsTerminal = false;
    bool colorOut = false;
    bool colorErr = false;
    int errColumns = 80;
    bool outIsTerminal = false;
  };
  // The process's own streams, as they are: terminals or not, NO_COLOR and TERM obeyed.
  static Setup processSetup();

  explicit Console(const Setup& setup) : setup_(setup) {}

  void withoutColor();
  bool errIsTerminal() const { return setup_.errIsTerminal; }
  bool outIsTerminal() const { return setup_.outIsTerminal; }

  // One line of a result for people. A heading is bold where that is possible.
  void result(std::string_view line);
  void heading(std::string_view line);
  // A machine-readable result, as it stands.
  void raw(std::string_view text);

  void error(std::string_view message);
  void warning(std::string_view message);
  void hint(std::string_view message);
  void log(std::string_view message);

  // Redraws the one progress line, cut to the terminal's width; every other line that goes to
  // standard error removes it first. Does nothing when standard error is no terminal.
  void progress(std::string_view line);
  void endProgress();

  // Flushes; false when standard output did not take everything.
  bool finish();

 private:
  void errLine(std::string_view prefix, const char* color, std::string_view text);
  void clearProgress();

  std::mutex mutex_;
  Setup setup_;
  bool progressShown_ = false;
};

// Text for the terminal: as \xNN stand control characters, line breaks among them, bytes that are
// no UTF-8, and marks that turn the direction of text.
std::string printable(std::string_view text);

// The columns a text takes on a terminal, counted in code points.
std::size_t columnsOf(std::string_view text);
// At most that many columns (three or more): the start of the text and three dots.
std::string shortened(std::string_view text, std::size_t columns);
std::string padded(std::string_view text, std::size_t columns);

}  // namespace kx::cli
