#include "markup_parser.h"

#include <libxml/HTMLparser.h>
#include <libxml/parser.h>
#include <libxml/xmlerror.h>

#include <cstring>
#include <mutex>
#include <vector>

namespace orvex {
namespace extract {
namespace {

constexpr size_t kBlock = 64 * 1024;

// What the SAX callbacks reach through libxml2's user data pointer.
struct ParseState {
  MarkupHandler* handler = nullptr;
  xmlParserCtxtPtr context = nullptr;
  std::string first_error;
  Attributes attributes;  // reused for every element
};

std::string_view View(const xmlChar* text) {
  return text == nullptr ? std::string_view()
                         : std::string_view(reinterpret_cast<const char*>(text));
}

void StopIfDone(ParseState* state) {
  if (state->handler->Done() && state->context != nullptr) xmlStopParser(state->context);
}

void OnStartElementNs(void* ctx, const xmlChar* localname, const xmlChar* /*prefix*/,
                      const xmlChar* /*uri*/, int /*nb_namespaces*/, const xmlChar** /*namespaces*/,
                      int nb_attributes, int /*nb_defaulted*/, const xmlChar** attributes) {
  auto* state = static_cast<ParseState*>(ctx);
  state->attributes.clear();
  // Five pointers per attribute: local name, prefix, URI, value, value end.
  for (int i = 0; i < nb_attributes; ++i) {
    const xmlChar** a = attributes + 5 * i;
    state->attributes.emplace_back(View(a[0]), std::string_view(reinterpret_cast<const char*>(a[3]),
                                                                static_cast<size_t>(a[4] - a[3])));
  }
  state->handler->StartElement(View(localname), state->attributes);
  StopIfDone(state);
}

void OnEndElementNs(void* ctx, const xmlChar* localname, const xmlChar* /*prefix*/,
                    const xmlChar* /*uri*/) {
  auto* state = static_cast<ParseState*>(ctx);
  state->handler->EndElement(View(localname));
  StopIfDone(state);
}

void OnStartElement(void* ctx, const xmlChar* name, const xmlChar** attributes) {
  auto* state = static_cast<ParseState*>(ctx);
  state->attributes.clear();
  for (const xmlChar** a = attributes; a != nullptr && a[0] != nullptr; a += 2) {
    state->attributes.emplace_back(View(a[0]), View(a[1]));
  }
  state->handler->StartElement(View(name), state->attributes);
  StopIfDone(state);
}

void OnEndElement(void* ctx, const xmlChar* name) {
  auto* state = static_cast<ParseState*>(ctx);
  state->handler->EndElement(View(name));
  StopIfDone(state);
}

void OnCharacters(void* ctx, const xmlChar* text, int len) {
  auto* state = static_cast<ParseState*>(ctx);
  if (len <= 0) return;
  state->handler->Characters(
      std::string_view(reinterpret_cast<const char*>(text), static_cast<size_t>(len)));
  StopIfDone(state);
}

void OnStructuredError(void* ctx, xmlErrorPtr error) {
  auto* state = static_cast<ParseState*>(ctx);
  if (error == nullptr || error->level < XML_ERR_ERROR || !state->first_error.empty()) return;
  std::string message = error->message != nullptr ? error->message : "parse error";
  while (!message.empty() && message.back() == '\n') message.pop_back();
  state->first_error = "libxml2: " + message + " (line " + std::to_string(error->line) + ")";
}

// libxml2 would otherwise print to stderr.
void Silent(void* /*ctx*/, const char* /*message*/, ...) {}

xmlSAXHandler MakeHandler() {
  xmlSAXHandler sax;
  std::memset(&sax, 0, sizeof(sax));
  sax.initialized = XML_SAX2_MAGIC;
  sax.startElementNs = OnStartElementNs;
  sax.endElementNs = OnEndElementNs;
  sax.startElement = OnStartElement;  // the HTML parser's callbacks
  sax.endElement = OnEndElement;
  sax.characters = OnCharacters;
  sax.ignorableWhitespace = OnCharacters;
  sax.cdataBlock = OnCharacters;
  sax.serror = OnStructuredError;
  sax.warning = Silent;
  sax.error = Silent;
  sax.fatalError = Silent;
  // No entity callbacks: declared entities are neither stored nor expanded,
  // which rules out exponential entity expansion.
  return sax;
}

xmlParserCtxtPtr CreateContext(Markup kind, xmlSAXHandler* sax, ParseState* state,
                               const char* first, int size) {
  if (kind == Markup::kHtml) {
    htmlParserCtxtPtr context =
        htmlCreatePushParserCtxt(sax, state, first, size, nullptr, XML_CHAR_ENCODING_NONE);
    if (context != nullptr) {
      htmlCtxtUseOptions(context, HTML_PARSE_RECOVER | HTML_PARSE_NONET | HTML_PARSE_NOWARNING |
                                      HTML_PARSE_NOERROR | HTML_PARSE_COMPACT);
    }
    return context;
  }
  xmlParserCtxtPtr context = xmlCreatePushParserCtxt(sax, state, first, size, nullptr);
  if (context != nullptr) xmlCtxtUseOptions(context, XML_PARSE_NONET | XML_PARSE_NOWARNING);
  return context;
}

void Push(Markup kind, xmlParserCtxtPtr context, const char* data, int size, bool last) {
  if (kind == Markup::kHtml) {
    htmlParseChunk(context, data, size, last ? 1 : 0);
  } else {
    xmlParseChunk(context, data, size, last ? 1 : 0);
  }
}

void FreeContext(Markup kind, xmlParserCtxtPtr context) {
  if (context->myDoc != nullptr) xmlFreeDoc(context->myDoc);
  context->myDoc = nullptr;
  if (kind == Markup::kHtml) {
    htmlFreeParserCtxt(context);
  } else {
    xmlFreeParserCtxt(context);
  }
}

}  // namespace

bool ParseMarkup(Markup kind, const ByteSource& source, MarkupHandler& handler,
                 std::string* error) {
  static std::once_flag init;
  std::call_once(init, [] { xmlInitParser(); });

  std::vector<char> buffer(kBlock);
  ssize_t n = source(buffer.data(), buffer.size());
  if (n < 0) {
    if (error != nullptr) *error = "read error";
    return false;
  }
  ParseState state;
  state.handler = &handler;
  xmlSAXHandler sax = MakeHandler();
  xmlParserCtxtPtr context = CreateContext(kind, &sax, &state, buffer.data(), static_cast<int>(n));
  if (context == nullptr) {
    if (error != nullptr) *error = "libxml2: cannot create a parser";
    return false;
  }
  state.context = context;
  bool read_error = false;
  bool last = n == 0;
  while (!handler.Done()) {
    if (last) {
      Push(kind, context, nullptr, 0, /*last=*/true);
      break;
    }
    n = source(buffer.data(), buffer.size());
    if (n < 0) {
      read_error = true;
      break;
    }
    last = n == 0;
    // The parser's own verdict is read from the context below.
    if (n > 0) Push(kind, context, buffer.data(), static_cast<int>(n), /*last=*/false);
    // An XML document with an error is read no further.
    if (kind == Markup::kXml && !context->wellFormed) break;
  }
  const bool well_formed = kind == Markup::kHtml || context->wellFormed || handler.Done();
  FreeContext(kind, context);
  if (read_error || !well_formed) {
    if (error != nullptr) {
      *error = read_error
                   ? "read error"
                   : (state.first_error.empty() ? "libxml2: not well-formed" : state.first_error);
    }
    return false;
  }
  return true;
}

std::string_view FindAttribute(const Attributes& attributes, std::string_view name) {
  for (const auto& attribute : attributes) {
    if (attribute.first == name) return attribute.second;
  }
  return std::string_view();
}

}  // namespace extract
}  // namespace orvex
