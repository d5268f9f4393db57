#pragma once

#include <atomic>
#include <exception>
#include <memory>
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

/// Cuts a stream of bytes into messages at a delimiter, parses them as XML and hands them on.
/// The stream is not trusted: whatever arrives costs a bounded amount of memory, and a message
/// that cannot be handled costs that message and a log line. One thread at a time, on which the
/// XML platform is initialised; only the stop flag may be set from another thread.
class MessageProcessor {
public:
  /// Why a message was given up.
  enum Error : int {
    MESSAGE_TOO_LONG = 1, ///< more than MAXIMUM_MESSAGE_LENGTH bytes without a delimiter
    MESSAGE_ILL_FORMED,   ///< not well-formed XML, or with a document type declaration
    MESSAGE_NOT_HANDLED   ///< HandleMessage threw
  };

  /// Bytes of the longest message that is looked at, its delimiter not counted.
  static constexpr unsigned long MAXIMUM_MESSAGE_LENGTH = 64UL * 1024;

  MessageProcessor();
  MessageProcessor(const MessageProcessor&) = delete;
  MessageProcessor& operator=(const MessageProcessor&) = delete;
  virtual ~MessageProcessor();

  /// Parses the message `data` of `length` bytes and hands its root element to HandleMessage,
  /// for whose duration the document lives. Called inside ReadMessages. Throws what the parser
  /// and HandleMessage throw, and Exception for a document type declaration.
  virtual void ParseMessage(Stream& stream, const unsigned char* data, unsigned long length) const;

  /// Whether `message` is worth parsing; false drops it silently.
  virtual bool IsValidMessage(const std::string& message) const = 0;

  /// Handles one parsed message. What it throws, of any type, ends this message only.
  virtual void HandleMessage(Stream& stream, const unsigned char* data, unsigned long length,
                             const xercesc::DOMNode& root) const = 0;

  /// Told of every message given up, with an Error and the message; of one that was too long to
  /// keep, with none. This version does nothing.
  virtual void HandleError(int error, Stream& stream, const unsigned char* data,
                           unsigned long length) const;

  /// The bytes that end each message, and their number; constant for the object's life.
  virtual std::pair<const unsigned char*, unsigned long> GetDelimiter() const = 0;

  /// Reads `stream` until it ends and handles its messages in order. Bytes behind the last
  /// delimiter are dropped.
  void ReadMessages(Stream& stream);

protected:
  std::atomic<bool> stop{false};     ///< asks whoever calls ReadMessages to make no new call
  std::vector<unsigned char> buffer; ///< bytes of the message that is still arriving

  /// The text of an exception that ended a message, for the log; "unknown exception" for a type
  /// that has none. Overridden by who knows more types.
  virtual std::string DescribeException(const std::exception_ptr& exception) const;

private:
  void ProcessMessage(Stream& stream, const unsigned char* data, unsigned long length) const;
  void GiveUp(Error error, const std::string& reason, Stream& stream, const unsigned char* data,
              unsigned long length) const;

  mutable std::unique_ptr<xercesc::XercesDOMParser> parser_; ///< there only during ReadMessages
  mutable bool spent_ = false; ///< the next message needs a new parser
};

} // namespace orva::util
