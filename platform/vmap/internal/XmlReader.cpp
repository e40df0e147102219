#include "platform/vmap/internal/XmlReader.h"

#include <expat.h>

#include <strings.h>

#include <algorithm>
#include <cstring>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/vmap/internal/ErrorText.h"
#include "platform/vmap/internal/XmlElement.h"

namespace platform::vmap::internal {
namespace {

struct Position {
  std::uint64_t line = 0;
  std::uint64_t column = 0;
};

// One open element. Containers gather their children here; text elements
// gather their text.
struct Frame {
  Frame(Element e, std::size_t at) : element(e), start(at) {}

  Element element;
  std::size_t start;  // byte offset of the start tag
  std::string text;
  Dictionary dictionary;
  Array array;
  std::optional<std::string> key;  // <dict>: a key still waiting for its value
  std::size_t keyStart = 0;
  Value root;  // <vmap>
};

struct ParserDeleter {
  void operator()(XML_ParserStruct* p) const { XML_ParserFree(p); }
};

// Reads one document through expat's callbacks.
// Thread safety: one per call of readXml; never shared.
class DocumentReader {
 public:
  explicit DocumentReader(const ReadLimits& limits) : limits_(limits) {}

  Result<Value> run(std::span<const std::uint8_t> bytes) {
    std::unique_ptr<XML_ParserStruct, ParserDeleter> parser(XML_ParserCreate("UTF-8"));
    if (!parser) return errorPlain(ErrorCode::MalformedXml, "out of memory for the XML parser");
    parser_ = parser.get();
    bytes_ = bytes;
    XML_SetUserData(parser_, this);
    XML_SetElementHandler(parser_, &onStart, &onEnd);
    XML_SetCharacterDataHandler(parser_, &onText);
    XML_SetXmlDeclHandler(parser_, &onXmlDecl);
    // Declarations are refused the moment they begin, so no entity is ever
    // defined, let alone expanded; nothing external is ever fetched.
    XML_SetStartDoctypeDeclHandler(parser_, &onDoctype);
    XML_SetEntityDeclHandler(parser_, &onEntityDecl);
    XML_SetParamEntityParsing(parser_, XML_PARAM_ENTITY_PARSING_NEVER);
    XML_SetExternalEntityRefHandler(parser_, &onExternalEntity);
    stack_.reserve(16);

    constexpr std::size_t kChunk = 1u << 30;  // XML_Parse takes an int length
    std::size_t at = 0;
    do {
      const std::size_t n = std::min(kChunk, bytes.size() - at);
      const bool last = at + n == bytes.size();
      if (XML_Parse(parser_, reinterpret_cast<const char*>(bytes.data() + at), static_cast<int>(n),
                    last) != XML_STATUS_OK) {
        if (error_) return *error_;
        return errorAtLine(ErrorCode::MalformedXml, XML_GetErrorLineNumber(parser_),
                           XML_GetErrorColumnNumber(parser_) + 1,
                           XML_ErrorString(XML_GetErrorCode(parser_)));
      }
      at += n;
    } while (at < bytes.size());
    if (error_) return *error_;  // a handler failed on the last event
    return std::move(result_);
  }

 private:
  static DocumentReader& self(void* data) { return *static_cast<DocumentReader*>(data); }
  static void XMLCALL onStart(void* data, const XML_Char* name, const XML_Char** attributes) {
    self(data).start(name, attributes);
  }
  static void XMLCALL onEnd(void* data, const XML_Char*) { self(data).end(); }
  static void XMLCALL onText(void* data, const XML_Char* s, int length) {
    self(data).text(std::string_view(s, static_cast<std::size_t>(length)));
  }
  static void XMLCALL onXmlDecl(void* data, const XML_Char* version, const XML_Char* encoding,
                                int) {
    self(data).xmlDeclaration(version, encoding);
  }
  static void XMLCALL onDoctype(void* data, const XML_Char*, const XML_Char*, const XML_Char*,
                                int) {
    DocumentReader& r = self(data);
    r.fail(ErrorCode::ForbiddenDeclaration, r.declarationStart("<!DOCTYPE"),
           "DOCTYPE declarations are not allowed");
  }
  static void XMLCALL onEntityDecl(void* data, const XML_Char*, int, const XML_Char*, int,
                                   const XML_Char*, const XML_Char*, const XML_Char*,
                                   const XML_Char*) {
    DocumentReader& r = self(data);
    r.fail(ErrorCode::ForbiddenDeclaration, r.here(), "entity declarations are not allowed");
  }
  static int XMLCALL onExternalEntity(XML_Parser, const XML_Char*, const XML_Char*,
                                      const XML_Char*, const XML_Char*) {
    return XML_STATUS_ERROR;
  }

  // Elements remember where they start as byte offsets, which expat hands
  // out cheaply; only an error pays for turning one into a line and column.
  std::size_t here() const {
    const XML_Index index = XML_GetCurrentByteIndex(parser_);
    return index < 0 ? 0 : static_cast<std::size_t>(index);
  }

  // Counts as expat does: CR LF, CR and LF each end a line; a column is a
  // character, not a byte; a byte-order mark takes no room.
  Position positionOf(std::size_t offset) const {
    const std::string_view text(reinterpret_cast<const char*>(bytes_.data()),
                                std::min(offset, bytes_.size()));
    Position p{1, 1};
    std::size_t i = text.starts_with("\xEF\xBB\xBF") ? 3 : 0;
    for (; i < text.size(); ++i) {
      const char c = text[i];
      if (c == '\n' || (c == '\r' && (i + 1 == bytes_.size() || bytes_[i + 1] != '\n'))) {
        ++p.line;
        p.column = 1;
      } else if (c != '\r' && (static_cast<unsigned char>(c) & 0xC0) != 0x80) {
        ++p.column;
      }
    }
    return p;
  }

  // Expat reports a declaration once it has read past its name; point at
  // its "<!" instead, found by searching back from there.
  std::size_t declarationStart(std::string_view opener) const {
    const std::string_view text(reinterpret_cast<const char*>(bytes_.data()), bytes_.size());
    const std::size_t at = text.rfind(opener, here());
    return at == std::string_view::npos ? here() : at;
  }

  void fail(ErrorCode code, std::size_t offset, const std::string& what) {
    if (error_) return;
    const Position at = positionOf(offset);
    error_ = errorAtLine(code, at.line, at.column, what);
    XML_StopParser(parser_, XML_FALSE);
  }

  void xmlDeclaration(const char* version, const char* encoding) {
    if (error_) return;
    if (version && std::strcmp(version, "1.0") != 0)
      fail(ErrorCode::MalformedXml, here(), "XML version " + quoted(version) + " is not 1.0");
    else if (encoding && strcasecmp(encoding, "UTF-8") != 0)
      fail(ErrorCode::ForbiddenDeclaration, here(),
           "encoding " + quoted(encoding) + " is not UTF-8");
  }

  void startRoot(std::string_view name, const char** attributes, std::size_t at) {
    if (name != "vmap") {
      fail(ErrorCode::BadRoot, at, "the root element is " + tag(name) + ", not <vmap>");
      return;
    }
    bool versioned = false;
    for (const char** a = attributes; *a; a += 2) {
      if (std::strcmp(a[0], "version") != 0) {
        fail(ErrorCode::UnexpectedAttribute, at, "unexpected attribute " + quoted(a[0]) + " on <vmap>");
        return;
      }
      if (std::strcmp(a[1], "1.0") != 0) {
        fail(ErrorCode::BadRoot, at, "vmap version " + quoted(a[1]) + " is not 1.0");
        return;
      }
      versioned = true;
    }
    if (!versioned) {
      fail(ErrorCode::BadRoot, at, "<vmap> has no version attribute");
      return;
    }
    stack_.emplace_back(Element::Vmap, at);
  }

  void start(const char* rawName, const char** attributes) {
    if (error_) return;
    const std::string_view name(rawName);
    const std::size_t at = here();
    if (stack_.empty()) return startRoot(name, attributes, at);
    const std::optional<Element> element = elementNamed(name);
    if (!element) return fail(ErrorCode::UnknownElement, at, "unknown element " + tag(name));
    const Frame& parent = stack_.back();
    if (*element == Element::Vmap)
      return fail(ErrorCode::MisplacedElement, at, "<vmap> inside " + tag(parent.element));
    if (*attributes)
      return fail(ErrorCode::UnexpectedAttribute, at,
                  "unexpected attribute " + quoted(*attributes) + " on " + tag(name));
    switch (parent.element) {
      case Element::Vmap:
        // While the first value is open it, not <vmap>, is the parent.
        if (!parent.root.isNone())
          return fail(ErrorCode::ExtraValue, at, "a second value in <vmap>, which holds one");
        if (*element == Element::Key) return fail(ErrorCode::MisplacedElement, at, "<key> outside a <dict>");
        break;
      case Element::Dict:
        if (!parent.key && *element != Element::Key)
          return fail(ErrorCode::MisplacedElement, at,
                      tag(name) + " in <dict> where a <key> belongs");
        if (parent.key && *element == Element::Key)
          return fail(ErrorCode::MissingValue, parent.keyStart,
                      "key " + quoted(*parent.key) + " has no value");
        break;
      case Element::Array:
        if (*element == Element::Key) return fail(ErrorCode::MisplacedElement, at, "<key> outside a <dict>");
        break;
      default:
        return fail(ErrorCode::MisplacedElement, at, tag(name) + " inside " + tag(parent.element));
    }
    if (++items_ > limits_.maxItems)
      return fail(ErrorCode::TooManyItems, at,
                  "more than " + std::to_string(limits_.maxItems) + " values");
    if (isContainer(*element) && ++containerDepth_ > limits_.maxDepth)
      return fail(ErrorCode::TooDeep, at,
                  "containers nested deeper than " + std::to_string(limits_.maxDepth));
    stack_.emplace_back(*element, at);
  }

  void text(std::string_view s) {
    if (error_ || stack_.empty()) return;
    Frame& top = stack_.back();
    if (holdsText(top.element)) {
      top.text.append(s);
      return;
    }
    std::size_t i = 0;
    while (i < s.size() && isXmlSpace(s[i])) ++i;
    if (i == s.size()) return;
    // Point at the first offending character, not at the start of the run:
    // skip the run's white space in the source (where a CR LF is still two
    // bytes).
    std::size_t at = here();
    while (at < bytes_.size() && isXmlSpace(static_cast<char>(bytes_[at]))) ++at;
    fail(ErrorCode::UnexpectedText, at,
         "unexpected text " + quoted(trimmed(s.substr(i))) + " in " + tag(top.element));
  }

  void end() {
    if (error_) return;
    Frame& frame = stack_.back();
    std::optional<Value> value;
    switch (frame.element) {
      case Element::Vmap:
        if (frame.root.isNone())
          return fail(ErrorCode::MissingValue, frame.start, "<vmap> holds no value");
        result_ = std::move(frame.root);
        stack_.pop_back();
        return;
      case Element::Key: {
        Frame& parent = stack_[stack_.size() - 2];
        if (parent.dictionary.contains(frame.text))
          return fail(ErrorCode::DuplicateKey, frame.start, "duplicate key " + quoted(frame.text));
        parent.key = std::move(frame.text);
        parent.keyStart = frame.start;
        stack_.pop_back();
        return;
      }
      case Element::Dict:
        if (frame.key)
          return fail(ErrorCode::MissingValue, frame.keyStart,
                      "key " + quoted(*frame.key) + " has no value");
        --containerDepth_;
        value = Value(std::move(frame.dictionary));
        break;
      case Element::Array:
        --containerDepth_;
        value = Value(std::move(frame.array));
        break;
      default:
        value = scalar(frame);
        if (!value) return;
    }
    stack_.pop_back();
    Frame& parent = stack_.back();
    switch (parent.element) {
      case Element::Dict:
        parent.dictionary.set(*parent.key, std::move(*value));
        parent.key.reset();
        break;
      case Element::Array:
        parent.array.append(std::move(*value));
        break;
      default:
        parent.root = std::move(*value);
    }
  }

  std::optional<Value> scalar(Frame& frame) {
    ErrorCode code;
    std::string what;
    std::optional<Value> value = scalarValue(frame.element, frame.text, code, what);
    if (!value) fail(code, frame.start, what);
    return value;
  }

  const ReadLimits& limits_;
  XML_Parser parser_ = nullptr;
  std::span<const std::uint8_t> bytes_;
  std::vector<Frame> stack_;
  std::size_t containerDepth_ = 0;
  std::size_t items_ = 0;
  std::optional<Error> error_;
  Value result_;
};

}  // namespace

Result<Value> readXml(std::span<const std::uint8_t> bytes, const ReadLimits& limits) {
  return DocumentReader(limits).run(bytes);
}

}  // namespace platform::vmap::internal
