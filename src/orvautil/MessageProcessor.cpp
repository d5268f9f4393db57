#include "orvautil/MessageProcessor.h"

#include "orvautil/Exception.h"
#include "orvautil/Stream.h"
#include "orvautil/Xml.h"

#include <xercesc/dom/DOMDocument.hpp>
#include <xercesc/dom/DOMElement.hpp>
#include <xercesc/dom/DOMException.hpp>
#include <xercesc/framework/MemBufInputSource.hpp>
#include <xercesc/parsers/XercesDOMParser.hpp>
#include <xercesc/sax/ErrorHandler.hpp>
#include <xercesc/sax/SAXParseException.hpp>
#include <xercesc/util/OutOfMemoryException.hpp>
#include <xercesc/util/XMLException.hpp>

#include <syslog.h>

#include <algorithm>
#include <array>
#include <optional>

namespace orva::util {

namespace {

/// Bytes read at once.
constexpr std::size_t CHUNK_SIZE = 16384;

/// Depth to which elements can be nested in the longest message: each takes at least "<a></a>".
/// Deeper nesting is ill-formed, but the parser would need as much memory again to find that out.
constexpr std::size_t DEEPEST_NESTING = MessageProcessor::MAXIMUM_MESSAGE_LENGTH / 7;

/// Bytes of the longest message after which the parser is used again. A longer one leaves it with
/// much memory.
constexpr unsigned long ORDINARY_LENGTH = 4096;

/// A message that is no acceptable XML document.
class IllFormedMessage : public Exception {
  using Exception::Exception;
};

/// Makes the first error end the parse.
class StrictErrorHandler : public xercesc::ErrorHandler {
public:
  void warning(const xercesc::SAXParseException& /*exception*/) override {}
  void error(const xercesc::SAXParseException& exception) override { throw exception; }
  void fatalError(const xercesc::SAXParseException& exception) override { throw exception; }
  void resetErrors() override {}
};

/// Parser for untrusted documents: no validation, nothing fetched, and no document type
/// declaration, so that there are no entities to expand.
class MessageParser : public xercesc::XercesDOMParser {
public:
  MessageParser() {
    setValidationScheme(Val_Never);
    setLoadExternalDTD(false);
    setDisableDefaultEntityResolution(true);
    setErrorHandler(&errorHandler_);
  }

  void doctypeDecl(const xercesc::DTDElementDecl& /*elementDecl*/, const XMLCh* /*publicId*/,
                   const XMLCh* /*systemId*/, bool /*hasInternalSubset*/,
                   bool /*hasExternalSubset*/) override {
    throw IllFormedMessage("document type declaration refused");
  }

  void startDocument() override {
    depth_ = 0;
    XercesDOMParser::startDocument();
  }

  void startElement(const xercesc::XMLElementDecl& elementDecl, const unsigned int uriId,
                    const XMLCh* const prefix,
                    const xercesc::RefVectorOf<xercesc::XMLAttr>& attributes,
                    const XMLSize_t attributeCount, const bool isEmpty,
                    const bool isRoot) override {
    if (depth_ == DEEPEST_NESTING) {
      throw IllFormedMessage("elements nested too deeply");
    }
    ++depth_; // also for an empty element: endElement is called for it
    XercesDOMParser::startElement(elementDecl, uriId, prefix, attributes, attributeCount, isEmpty,
                                  isRoot);
  }

  void endElement(const xercesc::XMLElementDecl& elementDecl, const unsigned int uriId,
                  const bool isRoot, const XMLCh* const prefix) override {
    --depth_;
    XercesDOMParser::endElement(elementDecl, uriId, isRoot, prefix);
  }

private:
  StrictErrorHandler errorHandler_;
  std::size_t depth_ = 0; ///< elements that have not ended
};

/// Provides a parser in `place` for as long as the scope lives.
class ParserScope {
public:
  explicit ParserScope(std::unique_ptr<xercesc::XercesDOMParser>& place) : place_(place) {
    place_ = std::make_unique<MessageParser>();
  }
  ParserScope(const ParserScope&) = delete;
  ParserScope& operator=(const ParserScope&) = delete;
  ~ParserScope() { place_.reset(); }

private:
  std::unique_ptr<xercesc::XercesDOMParser>& place_;
};

/// Releases a document.
struct DocumentRelease {
  void operator()(xercesc::DOMDocument* document) const noexcept { document->release(); }
};

} // namespace

MessageProcessor::MessageProcessor() = default;

MessageProcessor::~MessageProcessor() = default;

void MessageProcessor::HandleError(int /*error*/, Stream& /*stream*/, const unsigned char* /*data*/,
                                   unsigned long /*length*/) const {}

void MessageProcessor::ReadMessages(Stream& stream) {
  const ParserScope parser(parser_);
  const auto [delimiterBytes, delimiterLength] = GetDelimiter();
  const Bytes delimiter(delimiterBytes, delimiterLength);

  std::array<unsigned char, CHUNK_SIZE> chunk{};
  buffer.clear();
  std::size_t searched = 0; // bytes of the buffer that hold no beginning of a delimiter
  bool skipping = false;    // inside a message that is too long
  while (const unsigned count = stream.Read(chunk.data(), chunk.size())) {
    buffer.insert(buffer.end(), chunk.begin(), chunk.begin() + count);

    Bytes rest(buffer); // after the last delimiter
    Bytes unsearched = rest.subspan(searched);
    for (;;) {
      const auto end =
          std::search(unsearched.begin(), unsearched.end(), delimiter.begin(), delimiter.end());
      const bool ended = end != unsearched.end();
      const Bytes message(rest.begin(), end);
      // The last bytes may still turn out to begin a delimiter and then belong to no message.
      if (!skipping &&
          message.size() > MAXIMUM_MESSAGE_LENGTH + (ended ? 0 : delimiter.size() - 1)) {
        static_assert(MAXIMUM_MESSAGE_LENGTH == 65536);
        GiveUp(MESSAGE_TOO_LONG, "message of more than 65536 bytes skipped", stream, {});
        skipping = true;
      }
      if (!ended) {
        break;
      }
      if (!skipping) {
        ProcessMessage(stream, message);
      }
      skipping = false;
      rest = unsearched = rest.subspan(message.size() + delimiter.size());
    }

    const std::size_t unfinished = std::min(unsearched.size(), delimiter.size() - 1);
    const std::size_t kept = skipping ? unfinished : rest.size();
    buffer.erase(buffer.begin(), buffer.end() - static_cast<std::ptrdiff_t>(kept));
    searched = kept - unfinished;
  }
}

void MessageProcessor::ProcessMessage(Stream& stream, Bytes message) const {
  try {
    if (IsValidMessage(std::string(message.begin(), message.end()))) {
      ParseMessage(stream, message.data(), message.size());
    }
  } catch (const IllFormedMessage& exception) {
    GiveUp(MESSAGE_ILL_FORMED, exception.what(), stream, message);
  } catch (...) {
    GiveUp(MESSAGE_NOT_HANDLED, DescribeException(std::current_exception()), stream, message);
  }
}

void MessageProcessor::ParseMessage(Stream& stream, const unsigned char* data,
                                    unsigned long length) const {
  std::optional<ParserScope> ownParser;
  if (!parser_) {
    ownParser.emplace(parser_);
  } else if (spent_) {
    parser_ = std::make_unique<MessageParser>();
  }
  spent_ = length > ORDINARY_LENGTH;
  // The parser keeps the unfinished document of every ill-formed message.
  parser_->resetDocumentPool();
  try {
    parser_->parse(xercesc::MemBufInputSource(data, length, "message"));
  } catch (const xercesc::SAXException& exception) {
    throw IllFormedMessage(XMLCh2string(exception.getMessage()));
  } catch (const xercesc::XMLException& exception) {
    throw IllFormedMessage(XMLCh2string(exception.getMessage()));
  } catch (const xercesc::DOMException& exception) {
    throw IllFormedMessage(XMLCh2string(exception.getMessage()));
  } catch (const xercesc::OutOfMemoryException&) {
    // The parser believes that it is still parsing and would refuse every further message.
    spent_ = true;
    throw;
  }
  const std::unique_ptr<xercesc::DOMDocument, DocumentRelease> document(parser_->adoptDocument());
  HandleMessage(stream, data, length, *document->getDocumentElement());
}

std::string MessageProcessor::DescribeException(const std::exception_ptr& exception) const {
  try {
    std::rethrow_exception(exception);
  } catch (const std::exception& known) {
    return known.what();
  } catch (const std::string& text) {
    return text;
  } catch (const char* text) {
    return text;
  } catch (const xercesc::XMLException& known) {
    return XMLCh2string(known.getMessage());
  } catch (const xercesc::DOMException& known) {
    return XMLCh2string(known.getMessage());
  } catch (const xercesc::SAXException& known) {
    return XMLCh2string(known.getMessage());
  } catch (...) {
    return "unknown exception";
  }
}

void MessageProcessor::GiveUp(Error error, const std::string& reason, Stream& stream,
                              Bytes message) const {
  syslog(LOG_LOCAL1 | LOG_ERR, "MessageProcessor:: %s", reason.c_str());
  HandleError(error, stream, message.data(), message.size());
}

} // namespace orva::util
