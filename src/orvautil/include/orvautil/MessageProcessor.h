#pragma once

#include <atomic>
#include <exception>
#include <memory>
#include <span>
#include <string>
#include <utility>
#include <vector>

#include <xercesc/util/XercesDefs.hpp>

XERCES_CPP_NAMESPACE_BEGIN
class DOMNode;
class XercesDOMParser;
XERCES_CPP_NAMESPACE_END

namespace orva::util {

class Stream;

/// Cuts a stream of bytes into messages at a delimiter, parses them as XML and handles them. The
/// stream is untrusted: the memory it takes is bounded, and a message that cannot be handled is
/// skipped with a line in the log. Used by one thread at a time, which has initialised the XML
/// platform; only the stop flag may be set from another thread.
class MessageProcessor {
public:
  /// Why a message was skipped.
  enum Error : int {
    MESSAGE_TOO_LONG = 1, ///< more than MAXIMUM_MESSAGE_LENGTH bytes without a delimiter
    MESSAGE_ILL_FORMED, ///< not well-formed, nested too deeply, or has a document type declaration
    MESSAGE_NOT_HANDLED ///< HandleMessage threw
  };

  /// Bytes of the longest message that is handled, without its delimiter.
  static constexpr unsigned long MAXIMUM_MESSAGE_LENGTH = 64UL * 1024;

  MessageProcessor();
  MessageProcessor(const MessageProcessor&) = delete;
  MessageProcessor& operator=(const MessageProcessor&) = delete;
  virtual ~MessageProcessor();

  /// Parses the message `data` of `length` bytes and calls HandleMessage with its root element;
  /// the document lives until that returns. Outside of ReadMessages a parser is made for the call.
  /// Throws what the parser and HandleMessage throw, and Exception for a document that is not
  /// accepted.
  virtual void ParseMessage(Stream& stream, const unsigned char* data, unsigned long length) const;

  /// Whether `message` is to be parsed; otherwise it is skipped silently.
  virtual bool IsValidMessage(const std::string& message) const = 0;

  /// Handles one parsed message. An exception of any type ends this message only.
  virtual void HandleMessage(Stream& stream, const unsigned char* data, unsigned long length,
                             const xercesc::DOMNode& root) const = 0;

  /// Called for every message that is skipped, with an Error and the message; one that was too
  /// long comes without its bytes. This version does nothing.
  virtual void HandleError(int error, Stream& stream, const unsigned char* data,
                           unsigned long length) const;

  /// The bytes that end each message, and their number; the same for the life of the object.
  virtual std::pair<const unsigned char*, unsigned long> GetDelimiter() const = 0;

  /// Reads `stream` until it ends and handles its messages in order. Bytes after the last delimiter
  /// are dropped.
  void ReadMessages(Stream& stream);

protected:
  std::atomic<bool> stop{false};     ///< asks the caller of ReadMessages not to call it again
  std::vector<unsigned char> buffer; ///< bytes of the message that is still arriving

  /// The text of an exception that ended a message, for the log; "unknown exception" for a type
  /// that has none. Derived classes that know more types override it.
  virtual std::string DescribeException(const std::exception_ptr& exception) const;

private:
  using Bytes = std::span<const unsigned char>;

  void ProcessMessage(Stream& stream, Bytes message) const;
  void GiveUp(Error error, const std::string& reason, Stream& stream, Bytes message) const;

  mutable std::unique_ptr<xercesc::XercesDOMParser> parser_; ///< null outside of ReadMessages
  mutable bool spent_ = false; ///< the next message needs a new parser
};

} // namespace orva::util
