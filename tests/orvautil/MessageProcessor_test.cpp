#include "Listener.h"
#include "SocketPair.h"

#include "orvautil/ClientSocket.h"
#include "orvautil/Exception.h"
#include "orvautil/MessageProcessor.h"
#include "orvautil/Xml.h"

#include "support/XmlPlatform.h"
#include "system/Syslog.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <xercesc/dom/DOMException.hpp>
#include <xercesc/dom/DOMNode.hpp>
#include <xercesc/sax/SAXParseException.hpp>
#include <xercesc/util/RuntimeException.hpp>

#include <syslog.h>

#include <algorithm>
#include <filesystem>
#include <functional>
#include <ostream>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>
#include <vector>

namespace orva::util {
namespace {

using test::LogLine;
using test::PairEnd;
using test::SocketPair;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;
using testing::SizeIs;
using testing::StartsWith;

const std::string END(4, '\0');
constexpr auto LIMIT = MessageProcessor::MAXIMUM_MESSAGE_LENGTH;

/// Records its calls. Messages that contain "drop" are not valid.
class Recorder : public MessageProcessor {
public:
  bool IsValidMessage(const std::string& message) const override {
    looked.push_back(message);
    return message.find("drop") == std::string::npos;
  }

  void HandleMessage(Stream& stream, const unsigned char* data, unsigned long length,
                     const xercesc::DOMNode& root) const override {
    const std::string name = XMLCh2string(root.getNodeName());
    handled.push_back(name);
    bytes.emplace_back(data, data + length);
    largest = std::max(largest, buffer.capacity());
    streams.push_back(&stream);
    if (name == "throw") {
      thrower();
    }
  }

  void HandleError(int error, Stream& /*stream*/, const unsigned char* data,
                   unsigned long length) const override {
    errors.emplace_back(error, data == nullptr ? "none" : std::string(data, data + length));
    largest = std::max(largest, buffer.capacity());
  }

  std::pair<const unsigned char*, unsigned long> GetDelimiter() const override {
    static constexpr unsigned char DELIMITER[] = {0, 0, 0, 0};
    return {DELIMITER, sizeof DELIMITER};
  }

  std::size_t Capacity() const { return buffer.capacity(); }
  bool Stopped() const { return stop; }

  std::function<void()> thrower;            ///< called for a message <throw/>
  mutable std::vector<std::string> looked;  ///< arguments of IsValidMessage
  mutable std::vector<std::string> handled; ///< names of the root elements
  mutable std::vector<std::string> bytes;   ///< their messages
  mutable std::vector<const Stream*> streams;
  mutable std::vector<std::pair<int, std::string>> errors;
  mutable std::size_t largest = 0; ///< capacity of the buffer at any call
};

/// A processor, its system log and the XML platform.
class MessageProcessorTest : public testing::Test {
protected:
  /// Lets the processor read the `chunks`, each in a read of its own, and then the end.
  void ReadChunks(const std::vector<std::string>& chunks) {
    SocketPair pair(SOCK_SEQPACKET);
    std::jthread writer([&] {
      for (const std::string& chunk : chunks) {
        pair.far.Write(chunk.data(), static_cast<unsigned>(chunk.size()));
      }
      pair.far.Close();
    });
    processor.ReadMessages(pair.near);
  }

  /// Lets the processor read `bytes` in reads of any size, and then the end.
  void Read(const std::string& bytes) {
    SocketPair pair;
    std::jthread writer([&] {
      pair.far.Write(bytes.data(), static_cast<unsigned>(bytes.size()));
      pair.far.Close();
    });
    processor.ReadMessages(pair.near);
  }

  /// Lets the processor parse one message.
  void Parse(const std::string& message) {
    PairEnd none(-1);
    processor.ParseMessage(none, reinterpret_cast<const unsigned char*>(message.data()),
                           message.size());
  }

  /// Everything that was logged so far.
  std::vector<LogLine> Logged() const { return log_.Lines(); }

  Recorder processor;

private:
  test::XmlPlatform platform_;
  test::Syslog log_;
};

/// A well-formed message of `length` bytes with the root element `name`.
std::string MessageOf(const std::string& name, std::size_t length) {
  const std::string head = '<' + name + '>';
  const std::string tail = "</" + name + '>';
  return head + std::string(length - head.size() - tail.size(), 'x') + tail;
}

TEST_F(MessageProcessorTest, CutsTheStreamAtTheDelimiter) {
  Read("<a/>" + END + "<b/>" + END);
  EXPECT_THAT(processor.handled, ElementsAre("a", "b"));
  EXPECT_THAT(processor.bytes, ElementsAre("<a/>", "<b/>"));
  EXPECT_THAT(processor.errors, IsEmpty());
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(MessageProcessorTest, PassesItsStreamToTheHandler) {
  SocketPair pair;
  const std::string bytes = "<a/>" + END;
  pair.far.Write(bytes.data(), static_cast<unsigned>(bytes.size()));
  pair.far.Close();
  processor.ReadMessages(pair.near);
  EXPECT_THAT(processor.streams, ElementsAre(&pair.near));
}

TEST_F(MessageProcessorTest, ReadsFromAServiceThatListens) {
  const test::Listener service = test::ListenAtPath("/run/orva/messages.sock");
  ClientSocket client(Socket::Address("/run/orva/messages.sock"), false);
  std::jthread peer([&] {
    PairEnd connection(service.Accept());
    const std::string bytes = "<a/>" + END + "<b/>" + END;
    connection.Write(bytes.data(), static_cast<unsigned>(bytes.size()));
  });
  processor.ReadMessages(client);
  EXPECT_THAT(processor.handled, ElementsAre("a", "b"));
  std::filesystem::remove("/run/orva/messages.sock");
}

TEST_F(MessageProcessorTest, HandlesAMessageBeforeTheStreamEnds) {
  SocketPair pair;
  std::string answer(1, '\0');
  // The peer ends the stream only when the handler has answered.
  std::jthread peer([&] {
    const std::string bytes = "<throw/>" + END;
    pair.far.Write(bytes.data(), static_cast<unsigned>(bytes.size()));
    pair.far.Read(answer.data(), 1);
    pair.far.Close();
  });
  processor.thrower = [&pair] { pair.near.Write("!", 1); };
  processor.ReadMessages(pair.near);
  peer.join();
  EXPECT_EQ(answer, "!");
}

TEST_F(MessageProcessorTest, TwoMessagesInOneReadAreHandledInOrder) {
  ReadChunks({"<a/>" + END + "<b/>" + END});
  EXPECT_THAT(processor.handled, ElementsAre("a", "b"));
}

TEST_F(MessageProcessorTest, AStreamMayBeSplitAnywhere) {
  const std::string stream = "<a/>" + END + "<b c='d'/>" + END + "<e/>" + END;
  for (std::size_t first = 1; first < stream.size(); ++first) {
    for (std::size_t second = first + 1; second < stream.size(); ++second) {
      processor.handled.clear();
      ReadChunks(
          {stream.substr(0, first), stream.substr(first, second - first), stream.substr(second)});
      ASSERT_THAT(processor.handled, ElementsAre("a", "b", "e")) << first << ' ' << second;
    }
  }
  EXPECT_THAT(processor.errors, IsEmpty());
}

TEST_F(MessageProcessorTest, AStreamMayComeByteByByte) {
  std::vector<std::string> chunks;
  for (const char byte : "<a/>" + END + MessageOf("b", 300) + END + "<c/>" + END) {
    chunks.emplace_back(1, byte);
  }
  ReadChunks(chunks);
  EXPECT_THAT(processor.handled, ElementsAre("a", "b", "c"));
}

TEST_F(MessageProcessorTest, AMessageMayComeInManyReads) {
  Read(MessageOf("a", 60'000) + END + MessageOf("b", 60'000) + END);
  EXPECT_THAT(processor.handled, ElementsAre("a", "b"));
  EXPECT_THAT(processor.bytes, ElementsAre(MessageOf("a", 60'000), MessageOf("b", 60'000)));
}

TEST_F(MessageProcessorTest, ManyMessagesAreHandledInOrder) {
  std::string stream;
  std::vector<std::string> names;
  for (int i = 0; i < 5000; ++i) {
    names.push_back('m' + std::to_string(i));
    stream += '<' + names.back() + "/>" + END;
  }
  Read(stream);
  EXPECT_EQ(processor.handled, names);
}

TEST_F(MessageProcessorTest, ConsecutiveDelimitersEncloseEmptyMessages) {
  Read("<a/>" + END + END + END + "<drop/>" + END);
  EXPECT_THAT(processor.looked, ElementsAre("<a/>", "", "", "<drop/>"));
}

TEST_F(MessageProcessorTest, FewerZerosThanADelimiterArePartOfTheMessage) {
  Read("<drop>" + std::string(3, '\0') + "</drop>" + END);
  EXPECT_THAT(processor.looked, ElementsAre("<drop>" + std::string(3, '\0') + "</drop>"));
}

TEST_F(MessageProcessorTest, TheFirstFourOfFiveZerosAreTheDelimiter) {
  Read("<a/>" + END + std::string(1, '\0') + "<drop/>" + END + "<c/>" + END);
  EXPECT_THAT(processor.looked, ElementsAre("<a/>", std::string(1, '\0') + "<drop/>", "<c/>"));
  EXPECT_THAT(processor.handled, ElementsAre("a", "c"));
}

TEST_F(MessageProcessorTest, AMessageAfterASurplusZeroIsIllFormedAndTheNextIsHandled) {
  Read("<a/>" + END + std::string(1, '\0') + "<b/>" + END + "<c/>" + END);
  EXPECT_THAT(processor.handled, ElementsAre("a", "c"));
  EXPECT_THAT(processor.errors, ElementsAre(Pair(MessageProcessor::MESSAGE_ILL_FORMED,
                                                 std::string(1, '\0') + "<b/>")));
  EXPECT_THAT(Logged(), SizeIs(1));
}

TEST_F(MessageProcessorTest, AnInvalidMessageIsDroppedSilently) {
  Read("drop me, I am no document" + END + "<a/>" + END);
  EXPECT_THAT(processor.handled, ElementsAre("a"));
  EXPECT_THAT(processor.errors, IsEmpty());
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(MessageProcessorTest, BytesAfterTheLastDelimiterAreDropped) {
  Read("<a/>" + END + "<b/>");
  EXPECT_THAT(processor.looked, ElementsAre("<a/>"));
  Read("<c/>" + END);
  EXPECT_THAT(processor.looked, ElementsAre("<a/>", "<c/>"));
  EXPECT_THAT(processor.handled, ElementsAre("a", "c"));
}

TEST_F(MessageProcessorTest, APartialDelimiterAtTheEndIsDropped) {
  Read("<a/>" + std::string(3, '\0'));
  EXPECT_THAT(processor.looked, IsEmpty());
  Read(std::string(1, '\0') + "<drop/>" + END);
  EXPECT_THAT(processor.looked, ElementsAre(std::string(1, '\0') + "<drop/>"));
}

TEST_F(MessageProcessorTest, AnEmptyOrEndedStreamHasNoMessages) {
  Read("");
  PairEnd closed(-1);
  processor.ReadMessages(closed);
  EXPECT_THAT(processor.looked, IsEmpty());
}

TEST_F(MessageProcessorTest, AResetByThePeerEndsTheStream) {
  SocketPair pair;
  const std::string bytes = "<a/>" + END + "<b/>";
  pair.far.Write(bytes.data(), static_cast<unsigned>(bytes.size()));
  pair.near.Write("unread", 6);
  pair.far.Close();
  processor.ReadMessages(pair.near);
  EXPECT_THAT(processor.handled, ElementsAre("a"));
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(MessageProcessorTest, TheStopFlagIsInitiallyClearAndTheBufferEmpty) {
  EXPECT_FALSE(processor.Stopped());
  EXPECT_EQ(processor.Capacity(), 0U);
}

// Length.

const LogLine TOO_LONG{LOG_LOCAL1 | LOG_ERR,
                       "MessageProcessor:: message of more than 65536 bytes skipped"};

TEST_F(MessageProcessorTest, AMessageOfTheMaximumLengthIsHandled) {
  Read(MessageOf("a", LIMIT) + END + "<b/>" + END);
  EXPECT_THAT(processor.handled, ElementsAre("a", "b"));
  EXPECT_EQ(processor.bytes.front().size(), 65536U);
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(MessageProcessorTest, AMessageOfOneByteMoreIsSkippedAndTheNextHandled) {
  Read(MessageOf("a", LIMIT + 1) + END + "<b/>" + END);
  EXPECT_THAT(processor.looked, ElementsAre("<b/>"));
  EXPECT_THAT(processor.handled, ElementsAre("b"));
  EXPECT_THAT(processor.errors, ElementsAre(Pair(MessageProcessor::MESSAGE_TOO_LONG, "none")));
  EXPECT_THAT(Logged(), ElementsAre(TOO_LONG));
}

/// `message` and another one, in reads of which one ends `split` bytes into the delimiter.
std::vector<std::string> ChunksAround(const std::string& message, std::size_t split) {
  const std::string stream = message + END + "<b/>" + END;
  std::vector<std::string> chunks;
  for (std::size_t at = 0; at < message.size() + split; at += 8192) {
    chunks.push_back(stream.substr(at, std::min<std::size_t>(8192, message.size() + split - at)));
  }
  chunks.push_back(stream.substr(message.size() + split));
  return chunks;
}

TEST_F(MessageProcessorTest, TheMaximumLengthDoesNotCountASplitDelimiter) {
  for (std::size_t split = 0; split <= END.size(); ++split) {
    processor.handled.clear();
    ReadChunks(ChunksAround(MessageOf("a", LIMIT), split));
    EXPECT_THAT(processor.handled, ElementsAre("a", "b")) << split;
  }
  EXPECT_THAT(processor.errors, IsEmpty());
}

TEST_F(MessageProcessorTest, ASkippedMessageEndsAtASplitDelimiter) {
  for (const std::size_t length : {LIMIT + 1, LIMIT + 2, LIMIT + 3, LIMIT + 4, 3 * LIMIT}) {
    for (std::size_t split = 0; split <= END.size(); ++split) {
      processor.handled.clear();
      processor.errors.clear();
      ReadChunks(ChunksAround(MessageOf("a", length), split));
      EXPECT_THAT(processor.handled, ElementsAre("b")) << length << ' ' << split;
      EXPECT_THAT(processor.errors, ElementsAre(Pair(MessageProcessor::MESSAGE_TOO_LONG, "none")));
    }
  }
}

TEST_F(MessageProcessorTest, ALongMessageWithRunsOfZerosIsReportedOnce) {
  std::string message;
  while (message.size() < 4 * LIMIT) {
    message += "xx" + std::string(3, '\0');
  }
  Read(message + 'x' + END + "<b/>" + END);
  EXPECT_THAT(processor.handled, ElementsAre("b"));
  EXPECT_THAT(Logged(), ElementsAre(TOO_LONG));
}

TEST_F(MessageProcessorTest, EachLongMessageIsReported) {
  const std::string message = MessageOf("a", 2 * LIMIT) + END;
  Read(message + message + "<b/>" + END + message);
  EXPECT_THAT(processor.handled, ElementsAre("b"));
  EXPECT_THAT(Logged(), ElementsAre(TOO_LONG, TOO_LONG, TOO_LONG));
}

TEST_F(MessageProcessorTest, AStreamWithoutDelimitersUsesBoundedMemory) {
  SocketPair pair;
  std::jthread writer([&] {
    const std::string block(1 << 20, 'x');
    for (int i = 0; i < 64; ++i) {
      pair.far.Write(block.data(), static_cast<unsigned>(block.size()));
    }
    const std::string end = END + "<b/>" + END;
    pair.far.Write(end.data(), static_cast<unsigned>(end.size()));
    pair.far.Close();
  });
  processor.ReadMessages(pair.near);
  EXPECT_THAT(processor.handled, ElementsAre("b"));
  EXPECT_THAT(Logged(), ElementsAre(TOO_LONG));
  EXPECT_LE(processor.largest, 4 * LIMIT);
  EXPECT_LE(processor.Capacity(), 4 * LIMIT);
}

// Parsing.

TEST_F(MessageProcessorTest, IllFormedMessagesAreReportedAndTheNextHandled) {
  const std::vector<std::string> messages = {
      "no document", "<a>",         "<a></b>",     "<a/><b/>",  "<a b=c/>", "<a b='1' b='2'/>",
      "<a>&x;</a>",  "<a>\x01</a>", "<a>\xff</a>", "",          " ",        "<?xml version='1.0'?>",
      "<a b='<'/>",  "<x:a/>text",  "<!-- -->",    "<a>]]></a>"};
  std::string stream;
  for (const std::string& message : messages) {
    stream += message + END;
  }
  Read(stream + "<good/>" + END);
  EXPECT_THAT(processor.handled, ElementsAre("good"));
  std::vector<std::pair<int, std::string>> expected;
  for (const std::string& message : messages) {
    expected.emplace_back(MessageProcessor::MESSAGE_ILL_FORMED, message);
  }
  EXPECT_EQ(processor.errors, expected);
  const auto lines = Logged();
  EXPECT_THAT(lines, SizeIs(messages.size()));
  for (const LogLine& line : lines) {
    EXPECT_EQ(line.priority, LOG_LOCAL1 | LOG_ERR);
    EXPECT_THAT(line.text, StartsWith("MessageProcessor:: "));
    EXPECT_GT(line.text.size(), std::string("MessageProcessor:: ").size());
  }
}

TEST_F(MessageProcessorTest, EveryDocumentTypeDeclarationIsRefused) {
  const std::vector<std::string> messages = {
      "<!DOCTYPE a><a/>",
      "<!DOCTYPE a [<!ENTITY x 'y'>]><a>&x;</a>",
      "<!DOCTYPE a [<!ENTITY x SYSTEM '/etc/hostname'>]><a>&x;</a>",
      "<!DOCTYPE a [<!ENTITY % x SYSTEM '/etc/hostname'> %x;]><a/>",
      "<!DOCTYPE a SYSTEM '/etc/hostname'><a/>",
      "<!DOCTYPE a PUBLIC '-//x' 'http://127.0.0.1/x.dtd'><a/>",
      "<?xml version='1.0' standalone='no'?><!-- --><!DOCTYPE a SYSTEM 'x' []><a/>"};
  std::string stream;
  for (const std::string& message : messages) {
    stream += message + END + "<good/>" + END;
  }
  Read(stream);
  EXPECT_EQ(processor.handled, std::vector<std::string>(messages.size(), "good"));
  ASSERT_THAT(processor.errors, SizeIs(messages.size()));
  for (std::size_t i = 0; i < messages.size(); ++i) {
    EXPECT_THAT(processor.errors[i], Pair(MessageProcessor::MESSAGE_ILL_FORMED, messages[i]));
  }
  EXPECT_EQ(Logged(),
            std::vector<LogLine>(
                messages.size(),
                {LOG_LOCAL1 | LOG_ERR, "MessageProcessor:: document type declaration refused"}));
}

TEST_F(MessageProcessorTest, CommentsInstructionsAndNamespacesAreAccepted) {
  Read("<?xml version='1.0' encoding='UTF-8'?><?pi data?><!-- c --><a/><?pi?><!-- c -->" + END +
       "<b xmlns:x='urn:x' x:c='&lt;&#65;'><![CDATA[<&]]></b>" + END +
       "<c xmlns:i='http://www.w3.org/2001/XMLSchema-instance' "
       "i:noNamespaceSchemaLocation='/tmp/none.xsd'/>" +
       END + "\xef\xbb\xbf<d/>" + END);
  EXPECT_THAT(processor.handled, ElementsAre("a", "b", "c", "d"));
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(MessageProcessorTest, TheDeepestPossibleNestingIsHandled) {
  std::string message;
  for (unsigned long i = 0; i < LIMIT / 7; ++i) {
    message.insert(0, "<a>");
    message += "</a>";
  }
  Read(message + END + std::string(LIMIT, '<') + END + "<b/>" + END);
  EXPECT_THAT(processor.handled, ElementsAre("a", "b"));
}

TEST_F(MessageProcessorTest, ElementsNestedTooDeeplyAreRefusedBeforeTheMessageEnds) {
  std::string message;
  while (message.size() < LIMIT / 2) {
    message += "<a>";
  }
  Read(message + END + "<b/>" + END);
  EXPECT_THAT(processor.handled, ElementsAre("b"));
  EXPECT_THAT(Logged(), ElementsAre(LogLine{LOG_LOCAL1 | LOG_ERR,
                                            "MessageProcessor:: elements nested too deeply"}));
}

TEST_F(MessageProcessorTest, ManyAttributesAreHandled) {
  std::string message = "<a";
  for (int i = 0; message.size() < LIMIT - 100; ++i) {
    message += " a" + std::to_string(i) + "='x'";
  }
  Read(message + "/>" + END + "<b/>" + END);
  EXPECT_THAT(processor.handled, ElementsAre("a", "b"));
}

// One message without a stream of them.

TEST_F(MessageProcessorTest, AMessageCanBeParsedOutsideOfReadMessages) {
  Parse("<a/>");
  Parse(MessageOf("long", LIMIT));
  Parse("<b/>");
  EXPECT_THAT(processor.handled, ElementsAre("a", "long", "b"));
  EXPECT_THAT(processor.bytes, Contains("<b/>"));
  Read("<c/>" + END);
  Parse("<d/>");
  EXPECT_THAT(processor.handled, ElementsAre("a", "long", "b", "c", "d"));
}

TEST_F(MessageProcessorTest, AnIllFormedMessageOutsideOfReadMessagesIsThrown) {
  EXPECT_THROW(Parse("<a>"), Exception);
  EXPECT_THROW(Parse("<!DOCTYPE a><a/>"), Exception);
  processor.thrower = [] { throw std::runtime_error("broken handler"); };
  EXPECT_THROW(Parse("<throw/>"), std::runtime_error);
  Parse("<b/>");
  EXPECT_THAT(processor.handled, ElementsAre("throw", "b"));
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(MessageProcessorTest, AHandlerMayParseAnotherMessage) {
  processor.thrower = [this] { Parse("<inner>" + std::string(LIMIT / 2, 'x') + "</inner>"); };
  Read("<throw/>" + END + "<b/>" + END);
  Parse("<throw/>");
  EXPECT_THAT(processor.handled, ElementsAre("throw", "inner", "b", "throw", "inner"));
}

// Exceptions from the handler.

TEST_F(MessageProcessorTest, AStandardExceptionEndsItsMessageOnly) {
  processor.thrower = [] { throw std::runtime_error("broken handler"); };
  Read("<throw/>" + END + "<b/>" + END);
  EXPECT_THAT(processor.handled, ElementsAre("throw", "b"));
  EXPECT_THAT(processor.errors,
              ElementsAre(Pair(MessageProcessor::MESSAGE_NOT_HANDLED, "<throw/>")));
  EXPECT_THAT(Logged(),
              ElementsAre(LogLine{LOG_LOCAL1 | LOG_ERR, "MessageProcessor:: broken handler"}));
}

/// An exception and the text of its line in the log.
struct Thrown {
  const char* name;
  std::function<void()> thrower;
  std::string text;
};

void PrintTo(const Thrown& thrown, std::ostream* stream) {
  *stream << thrown.name;
}

class MessageProcessorThrownTest : public MessageProcessorTest,
                                   public testing::WithParamInterface<Thrown> {};

TEST_P(MessageProcessorThrownTest, AnExceptionOfAnyTypeEndsItsMessageOnly) {
  processor.thrower = GetParam().thrower;
  Read("<a/>" + END + "<throw/>" + END + "<b/>" + END);
  EXPECT_THAT(processor.handled, ElementsAre("a", "throw", "b"));
  EXPECT_THAT(processor.errors,
              ElementsAre(Pair(MessageProcessor::MESSAGE_NOT_HANDLED, "<throw/>")));
  const auto lines = Logged();
  ASSERT_THAT(lines, SizeIs(1));
  EXPECT_EQ(lines.front().priority, LOG_LOCAL1 | LOG_ERR);
  EXPECT_EQ(lines.front().text, "MessageProcessor:: " + GetParam().text);
}

struct Unknown {};

INSTANTIATE_TEST_SUITE_P(
    Handler, MessageProcessorThrownTest,
    testing::Values(
        Thrown{"OurException", [] { throw Exception("ours"); }, "ours"},
        Thrown{"BadAlloc", [] { throw std::bad_alloc(); }, std::bad_alloc().what()},
        Thrown{"PercentSign", [] { throw std::runtime_error("100%s %n"); }, "100%s %n"},
        Thrown{"String", [] { throw std::string("a database failure"); }, "a database failure"},
        Thrown{"Literal", [] { throw "a literal"; }, "a literal"},
        Thrown{"Int", [] { throw 7; }, "unknown exception"},
        Thrown{"Class", [] { throw Unknown(); }, "unknown exception"},
        Thrown{"XmlException",
               [] {
                 throw xercesc::RuntimeException(__FILE__, __LINE__,
                                                 xercesc::XMLExcepts::Gen_ParseInProgress,
                                                 xercesc::XMLPlatformUtils::fgMemoryManager);
               },
               "parsing in progress"},
        Thrown{"DomException",
               [] { throw xercesc::DOMException(xercesc::DOMException::NOT_FOUND_ERR, 0); },
               "attempt is made to reference a node in a context where it does not exist"},
        Thrown{"SaxException", [] { throw xercesc::SAXException("a parser's text"); },
               "a parser's text"}),
    [](const auto& thrown) { return thrown.param.name; });

TEST_F(MessageProcessorTest, TheBaseIgnoresErrors) {
  const SocketPair pair;
  MessageProcessor& base = processor;
  PairEnd closed(-1);
  EXPECT_NO_THROW(
      base.MessageProcessor::HandleError(MessageProcessor::MESSAGE_TOO_LONG, closed, nullptr, 0));
  EXPECT_THAT(processor.errors, IsEmpty());
}

TEST_F(MessageProcessorTest, AFaultyConnectionDoesNotAffectTheNext) {
  processor.thrower = [] { throw std::runtime_error("broken handler"); };
  Read("<throw/>" + END + MessageOf("long", LIMIT + 50));
  processor.handled.clear();
  Read("<b/>" + END);
  EXPECT_THAT(processor.handled, ElementsAre("b"));
}

} // namespace
} // namespace orva::util
