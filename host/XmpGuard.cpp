#include "host/XmpGuard.h"

#include "host/HostLimits.h"
#include "platform/foundation/Text.h"

namespace kx {

namespace {

constexpr std::size_t kEnd = std::string_view::npos;

// The position behind a piece of markup that ends with `closing`; kEnd when it never does.
std::size_t behind(std::string_view text, std::size_t from, std::string_view closing) {
  const std::size_t at = text.find(closing, from);
  return at == kEnd ? kEnd : at + closing.size();
}

// The position of the ">" that ends the tag: none inside quotes counts.
std::size_t endOfTag(std::string_view text, std::size_t from) {
  char quote = '\0';
  for (std::size_t at = from; at < text.size(); ++at) {
    const char letter = text[at];
    if (quote != '\0') {
      if (letter == quote) quote = '\0';
    } else if (letter == '"' || letter == '\'') {
      quote = letter;
    } else if (letter == '>') {
      return at;
    }
  }
  return kEnd;
}

std::string nestingObjection(std::string_view text) {
  std::size_t depth = 0;
  std::size_t at = text.find('<');
  while (at != kEnd) {
    const std::string_view rest = text.substr(at);
    if (rest.starts_with("<!--")) {
      at = behind(text, at + 4, "-->");
    } else if (rest.starts_with("<?")) {
      at = behind(text, at + 2, "?>");
    } else if (rest.starts_with("<![CDATA[")) {
      at = behind(text, at + 9, "]]>");
    } else if (rest.starts_with("<!")) {
      return "its XMP has a document type declaration or entity";
    } else {
      const std::size_t end = endOfTag(text, at + 1);
      if (end == kEnd) return {};
      if (rest.starts_with("</")) {
        if (depth > 0) --depth;
      } else if (text[end - 1] != '/' && ++depth > hostlimits::kXmpDepth) {
        return "its XMP is nested too deeply";
      }
      at = end;
    }
    if (at != kEnd) at = text.find('<', at);
  }
  return {};
}

}  // namespace

std::string xmpObjection(std::string_view packet) {
  if (packet.size() > hostlimits::kXmpBytes) return "its XMP is too large";
  // Packets are padded, some with NUL.
  const std::size_t last = packet.find_last_not_of('\0');
  if (last == kEnd) return {};
  const std::string_view text = packet.substr(0, last + 1);
  if (text.find('\0') != kEnd || !isValidUtf8(text)) return "its XMP is not in UTF-8";
  return nestingObjection(text);
}

}  // namespace kx
