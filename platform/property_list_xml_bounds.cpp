#include <algorithm>
#include <cstdint>
#include <vector>

#include "platform/property_list_bounds.h"
#include "platform/property_list_xml_values.h"
#include "platform/utf8.h"

namespace appsync {
namespace {

constexpr std::string_view Blanks = " \t\r\n";

bool isBlank(char c) { return c == ' ' || c == '\t' || c == '\r' || c == '\n'; }
/// What may stand in text without more ado.
bool isPlain(char c) {
  const auto byte = static_cast<unsigned char>(c);
  return (byte >= 0x20 && c != '<' && c != '>' && c != '&') || (isBlank(c) && c != ' ');
}
bool isNameCharacter(char c) { return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z'); }

class XmlReader {
 public:
  XmlReader(std::string_view document, const PropertyListLimits& limits)
      : document_(document),
        limits_(limits),
        depthLimit_(std::min(limits.depth, MaximumPropertyListDepth)) {
    out_.reserve(document.size() + 32);
  }

  bool run() {
    return isUtf8(document_) || fail("it is not valid UTF-8")
               ? readProlog() && readContents() && readEpilog()
               : false;
  }
  std::string takeOutput() { return std::move(out_); }
  std::string problem() const {
    const auto line = std::count(document_.begin(), document_.begin() + std::ptrdiff_t(at_), '\n');
    return std::string(problem_) + " (line " + std::to_string(line + 1) + ")";
  }

 private:
  struct Container {
    std::string_view name;
    bool isDictionary = false;
    bool hasKey = false;  ///< a key has been read, its value not yet
  };
  struct Tag {
    std::string_view name;
    bool closes = false;      ///< "</name>"
    bool closesSelf = false;  ///< "<name/>"
  };

  bool fail(const char* problem) {
    problem_ = problem;
    return false;
  }

  bool startsWith(std::string_view text) const { return document_.substr(at_).starts_with(text); }

  void skipBlanks() {
    while (at_ < document_.size() && isBlank(document_[at_])) ++at_;
  }

  /// Moves behind `end`, looked for from `skip` bytes on.
  bool skipPast(std::string_view end, std::size_t skip, const char* problem) {
    const std::size_t found = document_.find(end, at_ + skip);
    if (found == document_.npos) return fail(problem);
    at_ = found + end.size();
    return true;
  }

  /// Blanks, comments and processing instructions.
  bool skipMiscellany() {
    for (;;) {
      skipBlanks();
      if (startsWith("<!--")) {
        if (!skipPast("-->", 4, "a comment has no end")) return false;
      } else if (startsWith("<?")) {
        if (!skipPast("?>", 2, "a processing instruction has no end")) return false;
      } else {
        return true;
      }
    }
  }

  bool readProlog() {
    if (startsWith("<?xml") && !checkDeclaration()) return false;
    if (!skipMiscellany()) return false;
    if (startsWith("<!DOCTYPE") && !(skipDocumentType() && skipMiscellany())) return false;
    Tag tag;
    if (!readTag(tag, true)) return false;
    if (tag.name != "plist" || tag.closes) return fail("it has no plist element");
    if (tag.closesSelf) return fail("it holds no value");
    out_ += "<plist>";
    return true;
  }

  bool checkDeclaration() {
    const std::size_t end = document_.find("?>", at_);
    const std::string_view text = document_.substr(at_, end - at_);
    const std::size_t name = text.find("encoding");
    if (end == document_.npos || name == text.npos) return true;
    const std::size_t open = text.find_first_of("\"'", name);
    if (open == text.npos) return fail("the declaration is damaged");
    std::string encoding(text.substr(open + 1, text.find(text[open], open + 1) - open - 1));
    std::transform(encoding.begin(), encoding.end(), encoding.begin(),
                   [](char c) { return c >= 'A' && c <= 'Z' ? char(c - 'A' + 'a') : c; });
    return encoding == "utf-8" || encoding == "utf8" || encoding == "us-ascii" ||
           fail("its encoding is not UTF-8");
  }

  bool skipDocumentType() {
    const char stop = seek("[>");
    if (stop == '[') return fail("it declares entities of its own");
    return stop ? skipPast(">", 0, "") : fail("the document type has no end");
  }

  /// Attributes say nothing here but a version, so only the plist element may have them.
  bool readTag(Tag& tag, bool mayHaveAttributes) {
    if (!startsWith("<"))
      return fail(at_ == document_.size() ? "it is cut off" : "text stands outside a value");
    ++at_;
    tag.closes = startsWith("/");
    if (tag.closes) ++at_;
    const std::size_t start = at_;
    while (at_ < document_.size() && isNameCharacter(document_[at_])) ++at_;
    tag.name = document_.substr(start, at_ - start);
    if (mayHaveAttributes && !seek("/>")) return fail("it is cut off");
    skipBlanks();
    tag.closesSelf = !tag.closes && startsWith("/");
    if (tag.closesSelf) ++at_;
    if (!startsWith(">")) return fail("an element is malformed");
    ++at_;
    return true;
  }

  /// Moves to the first of `stops` that stands outside quotes; 0 when there is none.
  char seek(std::string_view stops) {
    const std::string wanted = "\"'" + std::string(stops);
    for (;;) {
      at_ = std::min(document_.find_first_of(wanted, at_), document_.size());
      if (at_ == document_.size()) return 0;
      const char found = document_[at_];
      if (stops.find(found) != stops.npos) return found;
      if (!skipPast(std::string_view(&found, 1), 1, "")) return 0;
    }
  }

  bool readContents() {
    bool hasValue = false;
    for (;;) {
      Tag tag;
      if (!skipMiscellany() || !readTag(tag, false)) return false;
      if (containers_.empty() && tag.closes && tag.name == "plist") break;
      if (containers_.empty() && hasValue) return fail("it holds more than one value");
      if (!readElement(tag)) return false;
      hasValue = true;
    }
    out_ += "</plist>";
    return hasValue || fail("it holds no value");
  }

  bool readEpilog() {
    if (!skipMiscellany()) return false;
    return at_ == document_.size() || fail("something follows the plist element");
  }

  bool readElement(const Tag& tag) {
    if (tag.closes) return closeContainer(tag.name);
    if (++objects_ > limits_.objects) return fail("it holds too many objects");
    if (tag.name == "key") return readKey(tag);
    if (!containers_.empty() && !beginEntry()) return false;
    if (tag.name == "array" || tag.name == "dict") return openContainer(tag);
    return readScalar(tag);
  }

  /// A value comes next in the innermost container.
  bool beginEntry() {
    Container& container = containers_.back();
    if (!container.isDictionary) return true;
    if (!container.hasKey) return fail("a dictionary's value has no key");
    container.hasKey = false;
    return true;
  }

  bool openContainer(const Tag& tag) {
    if (containers_.size() == depthLimit_) return fail("it is nested too deeply");
    const bool isDictionary = tag.name == "dict";
    out_ += isDictionary ? "<array><true/>" : "<array><false/>";
    containers_.push_back({tag.name, isDictionary});
    return !tag.closesSelf || closeContainer(tag.name);
  }

  bool closeContainer(std::string_view name) {
    if (containers_.empty() || containers_.back().name != name)
      return fail("an element is closed that is not open");
    if (containers_.back().hasKey) return fail("a dictionary's key has no value");
    out_ += "</array>";
    containers_.pop_back();
    return true;
  }

  bool readKey(const Tag& tag) {
    if (containers_.empty() || !containers_.back().isDictionary)
      return fail("a key stands outside a dictionary");
    Container& container = containers_.back();
    if (container.hasKey) return fail("a dictionary's key has no value");
    container.hasKey = true;
    return readText(tag) && emitElement("string");
  }

  bool readScalar(const Tag& tag) {
    if (!readText(tag)) return false;
    if (tag.name == "string") return emitElement(tag.name);
    if (tag.name == "true" || tag.name == "false") {
      if (text_.find_first_not_of(Blanks) != text_.npos) return fail("a boolean holds text");
      out_ += tag.name == "true" ? "<true/>" : "<false/>";
      return true;
    }
    if (tag.name == "data")
      return canonicalXmlData(text_) ? emitElement(tag.name) : fail("data is not Base64");
    const std::size_t start = std::min(text_.find_first_not_of(Blanks), text_.size());
    text_.erase(text_.find_last_not_of(Blanks) + 1).erase(0, std::min(start, text_.size()));
    if (tag.name == "integer")
      return canonicalXmlInteger(text_) ? emitElement(tag.name)
                                        : fail("an integer is malformed or too large");
    if (tag.name == "real")
      return canonicalXmlReal(text_) ? emitElement(tag.name)
                                     : fail("a real is malformed or too large");
    if (tag.name == "date")
      return isXmlDate(text_) ? emitElement(tag.name) : fail("a date is malformed");
    return fail("an element has an unknown name");
  }

  /// Reads up to and with the end tag; leaves the text, with only "&", "<" and ">" escaped, in
  /// `text_`.
  bool readText(const Tag& tag) {
    text_.clear();
    if (tag.closesSelf) return true;
    for (;;) {
      const std::size_t start = at_;
      while (at_ < document_.size() && isPlain(document_[at_])) ++at_;
      text_ += document_.substr(start, at_ - start);
      if (startsWith("&")) {
        if (!readReference()) return false;
      } else if (startsWith("<![CDATA[")) {
        if (!readCharacterData()) return false;
      } else if (startsWith("<!--")) {
        if (!skipPast("-->", 4, "a comment has no end")) return false;
      } else if (startsWith(">")) {
        text_ += "&gt;";
        ++at_;
      } else if (at_ < document_.size() && !startsWith("<")) {
        return fail("it holds a control character");
      } else {
        Tag closing;
        if (!readTag(closing, false)) return false;
        return (closing.closes && closing.name == tag.name) ||
               fail("an element stands inside a value");
      }
    }
  }

  bool readCharacterData() {
    constexpr std::size_t opening = 9;
    const std::size_t start = at_ + opening;
    if (!skipPast("]]>", opening, "character data has no end")) return false;
    const std::string_view text = document_.substr(start, at_ - 3 - start);
    for (const char c : text) appendEscaped(static_cast<unsigned char>(c), c);
    return isXmlText(text) || fail("it holds a control character");
  }

  bool readReference() {
    constexpr std::size_t longest = 16;
    const std::size_t length = document_.substr(at_, longest).find(';');
    if (length == document_.npos) return fail("an entity is malformed");
    const auto character = xmlReference(document_.substr(at_ + 1, length - 1));
    if (!character) return fail("an entity is unknown or no character");
    appendEscaped(*character, 0);
    at_ += length + 1;
    return true;
  }

  /// Appends a character, or the raw byte of one, escaped where it would be read as markup.
  void appendEscaped(char32_t character, char rawByte) {
    if (character == U'&') {
      text_ += "&amp;";
    } else if (character == U'<') {
      text_ += "&lt;";
    } else if (character == U'>') {
      text_ += "&gt;";
    } else if (rawByte) {
      text_ += rawByte;
    } else {
      appendUtf8(text_, character);
    }
  }

  /// Writes an element that holds `text_`.
  bool emitElement(std::string_view name) {
    out_.append("<").append(name).append(">").append(text_);
    out_.append("</").append(name).append(">");
    return true;
  }

  std::string_view document_;
  PropertyListLimits limits_;
  std::size_t depthLimit_;
  std::size_t at_ = 0;
  std::size_t objects_ = 0;
  std::vector<Container> containers_;
  std::string text_;
  std::string out_;
  const char* problem_ = "";
};

}  // namespace

std::optional<std::string> canonicalXmlPropertyList(std::string_view document,
                                                    const PropertyListLimits& limits,
                                                    std::string& problem) {
  XmlReader reader(document, limits);
  if (reader.run()) return reader.takeOutput();
  problem = reader.problem();
  return std::nullopt;
}

}  // namespace appsync
