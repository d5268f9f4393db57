// Messages of up to the greatest length, with hostile content.

#include "Flood.h"

#include "orvautil/FileDescriptor.h"
#include "support/TestScale.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/inotify.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <fstream>
#include <system_error>

namespace orva::test {
namespace {

using ::testing::AnyOf;
using ::testing::IsEmpty;
using ::testing::Ne;
using ::testing::StartsWith;

using HostileMessage = Flood;

const std::string START = R"(<ORVANotification Name="Unplugged" MountPoint="/shares/A")";
const std::string FINISH = "</ORVANotification>";

/// `count` nested elements, with `content` in the innermost one.
std::string Nested(std::size_t count, const std::string& content = "") {
  return Repeated("<a>", count) + content + Repeated("</a>", count);
}

/// As many nested elements as fit between `head` and `tail`.
std::string DeepestNesting(const std::string& head, const std::string& content,
                           const std::string& tail) {
  return head + Nested((LONGEST - head.size() - content.size() - tail.size()) / 7, content) + tail;
}

/// A file that knows whether it has been opened.
class Decoy {
public:
  explicit Decoy(const std::string& path) : events_(inotify_init1(IN_NONBLOCK | IN_CLOEXEC)) {
    std::ofstream(path) << "<!ENTITY decoy 'opened'>";
    if (inotify_add_watch(events_.Get(), path.c_str(), IN_OPEN | IN_ACCESS) == -1) {
      throw std::system_error(errno, std::generic_category(), path);
    }
  }

  bool WasOpened() const {
    std::array<char, 4096> event{};
    return read(events_.Get(), event.data(), event.size()) > 0;
  }

private:
  util::FileDescriptor events_;
};

/// A server on this machine that knows whether a client has connected to it.
class DecoyServer {
public:
  DecoyServer() : listener_(socket(AF_INET, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0)) {
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t size = sizeof address;
    if (bind(listener_.Get(), reinterpret_cast<const sockaddr*>(&address), size) != 0 ||
        listen(listener_.Get(), SOMAXCONN) != 0 ||
        getsockname(listener_.Get(), reinterpret_cast<sockaddr*>(&address), &size) != 0) {
      throw std::system_error(errno, std::generic_category(), "decoy server");
    }
    url_ = "http://127.0.0.1:" + std::to_string(ntohs(address.sin_port)) + "/decoy";
  }

  const std::string& Url() const { return url_; }

  bool WasConnected() const {
    const util::FileDescriptor client(accept4(listener_.Get(), nullptr, nullptr, SOCK_CLOEXEC));
    return static_cast<bool>(client);
  }

private:
  util::FileDescriptor listener_;
  std::string url_;
};

// --- Bytes -------------------------------------------------------------------------------------

TEST_F(HostileMessage, InvalidUtf8IsRefused) {
  std::vector<std::string> invalid = {
      "\xc0\x80",         "\xc1\xbf",         "\xe0\x80\x80",     "\xed\xa0\x80", "\xed\xbf\xbf",
      "\xf0\x80\x80\x80", "\xf4\x90\x80\x80", "\xf8\x88\x80\x80", "\xc3",         "\xe2\x82",
      "\xf0\x9f\x98",     "\xef\xbf\xbf",     "\xfe\xff"};
  for (int byte = 0x80; byte <= 0xff; ++byte) {
    invalid.emplace_back(1, static_cast<char>(byte));
  }
  for (const std::string& bytes : invalid) {
    EXPECT_THAT(Refused(Notification("Unplugged", "/shares/" + bytes)), Ne("")) << bytes;
    EXPECT_THAT(Refused(Notification("Unplugged", "/shares/A", bytes)), Ne("")) << bytes;
  }
  ExpectUnharmed("invalid UTF-8");
}

TEST_F(HostileMessage, ControlCharactersAreRefused) {
  for (char c = 1; c < ' '; ++c) {
    if (c != '\t' && c != '\n' && c != '\r') {
      EXPECT_THAT(Refused(Notification("Unplugged", std::string("/shares/") + c)), Ne(""));
      EXPECT_THAT(Refused(Notification("Unplugged", "/shares/&#" + std::to_string(c) + ";")),
                  Ne(""));
    }
  }
  EXPECT_THAT(Refused(Notification("Unplugged", std::string("/shares/\0A", 10))), Ne(""));
  ExpectUnharmed("control characters");
}

TEST_F(HostileMessage, EveryOtherEncodingIsHandledOrRefused) {
  const std::vector<std::string> encodings = {"US-ASCII",
                                              "ISO-8859-1",
                                              "ISO-8859-2",
                                              "ISO-8859-5",
                                              "ISO-8859-6",
                                              "ISO-8859-7",
                                              "ISO-8859-8",
                                              "ISO-8859-9",
                                              "ISO-8859-13",
                                              "ISO-8859-15",
                                              "windows-1250",
                                              "windows-1251",
                                              "windows-1252",
                                              "KOI8-R",
                                              "macintosh",
                                              "IBM037",
                                              "IBM1047",
                                              "IBM1140",
                                              "EBCDIC-CP-US",
                                              "UTF-7",
                                              "UTF-16",
                                              "UTF-16LE",
                                              "UTF-16BE",
                                              "UCS-4",
                                              "UCS-4LE",
                                              "UTF-32",
                                              "UTF-32BE",
                                              "SCSU",
                                              "BOCU-1",
                                              "CESU-8",
                                              "Shift_JIS",
                                              "EUC-JP",
                                              "ISO-2022-JP",
                                              "ISO-2022-KR",
                                              "EUC-KR",
                                              "Big5",
                                              "GB2312",
                                              "GBK",
                                              "GB18030",
                                              "HZ-GB-2312",
                                              "IMAP-mailbox-name",
                                              "LMBCS-1",
                                              "x-none",
                                              "../../etc",
                                              "UTF-8UTF-8",
                                              std::string(60'000, 'e')};
  const std::string rest = GOOD.substr(GOOD.find("<ORVA"));
  for (const std::string& encoding : encodings) {
    const Log log =
        appliance.Handle("<?xml version=\"1.0\" encoding=\"" + encoding + "\"?>" + rest);
    ASSERT_EQ(1U, log.size()) << encoding << ::testing::PrintToString(log);
    EXPECT_THAT(log[0].text, AnyOf(HANDLED[0].text, StartsWith("MessageProcessor:: "),
                                   StartsWith("ERROR ! Node name = ")))
        << encoding;
    Handled(GOOD);
  }
  ExpectUnharmed("other encodings declared");
}

TEST_F(HostileMessage, AMessageInUtf16IsHandledOrRefused) {
  // The comment has the root element's name in single bytes, the rest of the message is UTF-16.
  std::string wide = "\xfe\xff";
  for (const char c : "<!--" + std::string(1, '\1') + "-->" + START + "/>") {
    wide += c == '\1' ? std::string("ORVANotification") : std::string{'\0', c};
  }
  Handled(wide);
  EXPECT_THAT(Refused(wide.erase(2, 1)), Ne("")); // the halves of characters
  ExpectUnharmed("messages in UTF-16");
}

// --- Structure ---------------------------------------------------------------------------------

TEST_F(HostileMessage, TheDeepestNestingIsHandled) {
  Handled(DeepestNesting(START + ">", "", FINISH));
  Handled(DeepestNesting(START + ">", "text", FINISH));
  EXPECT_THAT(Refused(Filled(START + ">", "<a>", "")), Ne(""));
  EXPECT_THAT(Refused(Filled("<ORVANotification>", "<a>", "")), Ne(""));
  ExpectUnharmed("the deepest nesting");
}

TEST_F(HostileMessage, TheDeepestNestingInAProfileIsHandled) {
  const std::string batch = R"(<ORVANotification Name="TranscodedBatch" MountPoint="/shares/A">)";
  const Log only{Info(":: Transcodedbatch ")};
  for (const std::string& text : {std::string(), std::string("0123"), Repeated("<b/>x", 2'000)}) {
    EXPECT_EQ(only,
              appliance.Handle(DeepestNesting(batch + "<profile>", text, "</profile>" + FINISH)));
  }
  ExpectUnharmed("the deepest nesting in a profile");
  // The text of the innermost element counts as the profile.
  const Log log = appliance.Handle(
      DeepestNesting(batch + "<profile>", notify::TRANSCODING_PROFILE, "</profile>" + FINISH));
  ASSERT_LE(2U, log.size());
  EXPECT_EQ(BatchLines(), Log(log.begin(), log.begin() + 2));
}

TEST_F(HostileMessage, ManyProfilesAreHandled) {
  const std::string batch = R"(<ORVANotification Name="TranscodedBatch" MountPoint="/shares/A">)";
  const Log only{Info(":: Transcodedbatch ")};
  EXPECT_EQ(only, appliance.Handle(Filled(batch, "<profile/>", FINISH)));
  EXPECT_EQ(only, appliance.Handle(Filled(batch + "<profile>", "<a>x</a>", "</profile>" + FINISH)));
  EXPECT_EQ(only, appliance.Handle(Filled(batch + "<profile>", "x", "</profile>" + FINISH)));
  EXPECT_EQ(only, appliance.Handle(Filled(batch + "<profile>", "x<!---->", "</profile>" + FINISH)));
  ExpectUnharmed("profiles");
}

/// Generates names that are all different.
class Names {
public:
  /// "a", "b", ... "aa" and so on, with letters only.
  std::string Next() {
    std::string name;
    for (int number = ++number_; number > 0; number = (number - 1) / 26) {
      name += static_cast<char>('a' + (number - 1) % 26);
    }
    return name;
  }

private:
  int number_ = 0;
};

/// As many of `piece(name)` as fit between `head` and `tail`, each with a new name.
template <typename Piece>
std::string FilledWithNames(Names& names, const std::string& head, const std::string& tail,
                            Piece piece) {
  std::string message = head;
  for (;;) {
    const std::string next = piece(names.Next());
    if (message.size() + next.size() + tail.size() > LONGEST) {
      return message + tail;
    }
    message += next;
  }
}

TEST_F(HostileMessage, TheMostAttributesAreHandled) {
  const auto attribute = [](const std::string& name) { return " " + name + "=\"\""; };
  for (int i = 0; i < TestScale(3, 100); ++i) {
    Names names;
    Handled(FilledWithNames(names, START, "/>", attribute));
    Handled(FilledWithNames(names, START + "><a", "/>" + FINISH, attribute));
  }
  ExpectUnharmed("the most attributes");
}

TEST_F(HostileMessage, TheMostElementsAreHandled) {
  for (int i = 0; i < TestScale(3, 100); ++i) {
    Names names;
    Handled(Filled(START + ">", "<a/>", FINISH));
    Handled(FilledWithNames(names, START + ">", FINISH,
                            [](const std::string& name) { return "<" + name + "/>"; }));
  }
  ExpectUnharmed("the most elements");
}

TEST_F(HostileMessage, AllOfTheLargestAreHandledTogether) {
  for (int i = 0; i < TestScale(2, 20); ++i) {
    Names names;
    Handled(FilledWithNames(names, START, "/>",
                            [](const std::string& name) { return " " + name + "=\"\""; }));
    Handled(DeepestNesting(START + ">", "", FINISH));
    Refused(Filled(START + ">", "<a>", ""));
    Handled(Filled(START + ">", "<a/>", FINISH));
    Handled(FilledWithNames(names, START + ">", FINISH,
                            [](const std::string& name) { return "<" + name + "/>"; }));
    Handled(Filled(START + ">", "<a>x</a>", FINISH));
    Handled(Filled(START + ">", "x<![CDATA[y]]>", FINISH));
    Handled(START + " a=\"" + std::string(60'000, 'a') + "\"/>");
  }
  ExpectUnharmed("all of the largest messages");
}

TEST_F(HostileMessage, DuplicateAttributesAreRefused) {
  EXPECT_THAT(Refused(START + R"( MountPoint="/shares/B"/>)"), Ne(""));
  EXPECT_THAT(Refused(START + R"( Name="Purged"/>)"), Ne(""));
  EXPECT_THAT(Refused(Filled(START, " a=\"\"", "/>")), Ne(""));
  ExpectUnharmed("duplicate attributes");
}

TEST_F(HostileMessage, AMillionNamespacesAreHandled) {
  const int namespaces = TestScale(50'000, 1'000'000);
  Names names;
  int declared = 0;
  while (declared < namespaces) {
    Handled(FilledWithNames(names, START, "/>", [&declared](const std::string& name) {
      ++declared;
      return " xmlns:" + name + "=\"" + name + "\"";
    }));
  }
  ExpectUnharmed("a million namespaces");
}

TEST_F(HostileMessage, AMillionNamesAreHandled) {
  const int count = TestScale(50'000, 1'000'000);
  Names names;
  int used = 0;
  while (used < count) {
    Handled(FilledWithNames(names, START + ">", FINISH, [&used](const std::string& name) {
      ++used;
      return "<" + name + "/>";
    }));
  }
  ExpectUnharmed("a million names");
}

TEST_F(HostileMessage, HugeNamesAreHandled) {
  const std::string name(60'000, 'n');
  Handled(START + " " + name + "=\"\"/>");
  Handled(START + "><" + name + "/>" + FINISH);
  Handled("<?" + name + "?>" + START + "/>");
  Handled(START + " " + name + ":a=\"\"/>");
  Handled(START + ">&#x" + std::string(10'000, '0') + "41;" + FINISH);
  EXPECT_THAT(Refused(START + ">&" + name + ";" + FINISH), Ne(""));
  EXPECT_THAT(Refused(START + ">&#" + std::string(50'000, '9') + ";" + FINISH), Ne(""));
  EXPECT_EQ("ERROR ! Node name = " + name, Refused("<" + name + " a=\"ORVANotification\"/>"));
  EXPECT_THAT(appliance.Handle(Notification(name, "/shares/A")), IsEmpty());
  ExpectUnharmed("huge names");
}

TEST_F(HostileMessage, CommentsReferencesAndInstructionsAreHandled) {
  Handled(Filled(START + ">", "<?p i?>", FINISH));
  Handled(Filled(START + ">", "<![CDATA[]]>", FINISH));
  Handled(Filled(START + ">", "<![CDATA[x]]>y", FINISH));
  Handled(Filled(START + ">", "<!---->", FINISH));
  Handled(Filled("", "<!---->", START + "/>"));
  Handled(Filled("", "<?p?>", START + "/>"));
  Handled(Filled(START + "/>", "<?p?>", ""));
  Handled(Filled(START + ">", "&amp;", FINISH));
  Handled(Filled(START + ">", "&#65;", FINISH));
  EXPECT_THAT(Refused(Filled(START + "><![CDATA[", "]]", FINISH)), Ne(""));
  EXPECT_THAT(Refused(START + "/>" + START + "/>"), Ne(""));
  EXPECT_THAT(Refused(START + "><?xml version=\"1.0\"?>" + FINISH), Ne(""));
  ExpectUnharmed("comments, references and instructions");
}

// --- Document types and references to other documents
// ----------------------------------------------

TEST_F(HostileMessage, EntitiesAreNotExpanded) {
  const std::string root =
      R"(<ORVANotification Name="Purged" MountPoint="&j;">&j;</ORVANotification>)";
  std::string bomb = R"(<!DOCTYPE ORVANotification [<!ENTITY a "aaaaaaaaaa">)";
  for (char c = 'b'; c <= 'j'; ++c) {
    bomb += std::string("<!ENTITY ") + c + " \"" +
            Repeated(std::string("&") + char(c - 1) + ";", 10) + "\">";
  }
  const std::vector<std::string> messages = {
      bomb + "]>" + root,
      R"(<!DOCTYPE ORVANotification [<!ENTITY a "&b;"><!ENTITY b "&a;"><!ENTITY j "&a;">]>)" + root,
      R"(<!DOCTYPE ORVANotification [<!ENTITY % a "<!ENTITY j 'x'>">%a;]>)" + root,
      R"(<!DOCTYPE ORVANotification [<!ENTITY j ")" + std::string(60'000, 'j') + "\">]>" + root,
      R"(<!DOCTYPE ORVANotification [<!ATTLIST ORVANotification Name CDATA "Purged">]>)" + START +
          "/>",
      "<!DOCTYPE ORVANotification>" + START + "/>",
      Filled("<!DOCTYPE ORVANotification [", "<!ELEMENT a (a,a)>", "]>" + START + "/>"),
      "<!DOCTYPE ORVANotification [" + Filled("<!ELEMENT a ", "(", ""),
  };
  for (const std::string& message : messages) {
    EXPECT_THAT(Refused(message), Ne(""));
  }
  EXPECT_THAT(Refused(root), Ne("")); // an entity without a declaration
  ExpectUnharmed("entities");
}

TEST_F(HostileMessage, NoReferenceIsOpened) {
  const Decoy file("/tmp/decoy");
  const DecoyServer server;
  for (const std::string& url : {std::string("/tmp/decoy"), std::string("file:///tmp/decoy"),
                                 std::string("file://localhost/tmp/decoy"), server.Url()}) {
    for (const std::string& type :
         {"SYSTEM \"" + url + "\"", "PUBLIC \"-//A//B\" \"" + url + "\"",
          "[<!ENTITY a SYSTEM \"" + url + "\">]", "[<!ENTITY % a SYSTEM \"" + url + "\">%a;]",
          "[<!NOTATION n SYSTEM \"" + url + "\"><!ENTITY a SYSTEM \"" + url + "\" NDATA n>]"}) {
      EXPECT_THAT(Refused("<!DOCTYPE ORVANotification " + type + ">" + START + ">&a;" + FINISH),
                  Ne(""));
    }
    Handled("<?xml-stylesheet href=\"" + url + "\"?>" + START + "/>");
    Handled("<?xml-model href=\"" + url + "\"?>" + START + " xmlns=\"" + url + "\"/>");
    Handled(START + " xmlns:i=\"http://www.w3.org/2001/XInclude\"><i:include href=\"" + url +
            "\"/>" + FINISH);
    Handled(START +
            " xmlns:i=\"http://www.w3.org/2001/XMLSchema-instance\" "
            "i:noNamespaceSchemaLocation=\"" +
            url + "\" i:schemaLocation=\"urn:a " + url + "\" xml:base=\"" + url + "\"/>");
  }
  EXPECT_FALSE(file.WasOpened());
  EXPECT_FALSE(server.WasConnected());
  ExpectUnharmed("references to other documents");
}

// --- Mount points ------------------------------------------------------------------------------

/// The log of a Purged notification for a mount point that does not exist.
Log NoPlace(const std::string& mountPoint) {
  return {Info(":: Purged "),
          Error("There is no filesystem location for the mountpoint " + mountPoint),
          Info("Default:: Volume purged - ignored! ")};
}

TEST_F(HostileMessage, AHugeMountPointIsOnlyText) {
  const std::string path = "/" + std::string(60'000, 'p');
  EXPECT_EQ(NoPlace(path + "/"), appliance.Handle(Notification("Purged", path)));
  const std::string parents = "/shares" + Repeated("/../shares", 5'000);
  EXPECT_EQ(NoPlace(parents + "/"), appliance.Handle(Notification("Purged", parents)));
  ExpectUnharmed("huge mount points");
}

TEST_F(HostileMessage, AMountPointHasNoNul) {
  EXPECT_THAT(Refused(Notification("Purged", "/shares&#0;/A")), Ne(""));
  EXPECT_THAT(Refused(Notification("Purged", "/shares&#x0;/A")), Ne(""));
  // Its percent escape is not decoded, so that the path is not cut off.
  EXPECT_EQ(NoPlace("/shares%00/A/"), appliance.Handle(Notification("Purged", "/shares%00/A")));
  ExpectUnharmed("NULs in mount points");
}

TEST_F(HostileMessage, AnEscapeMayStandForAnyOtherByte) {
  for (int byte = 1; byte <= 0xff; ++byte) {
    std::array<char, 8> escape{};
    std::snprintf(escape.data(), escape.size(), "%%%02x", static_cast<unsigned>(byte));
    const std::string path = std::string("/nowhere/") + static_cast<char>(byte) + "x";
    EXPECT_EQ(NoPlace(path + "/"), appliance.Handle(Notification(
                                       "Purged", "/nowhere/" + std::string(escape.data()) + "x")))
        << byte;
  }
  ExpectUnharmed("escapes for odd bytes");
}

TEST_F(HostileMessage, ALineFeedInAMountPointForgesNoLogMessage) {
  const std::string forged = "/nowhere\n<142>Nov 21 00:00:00 zophotodbmerger: forged";
  for (const char* const lineFeed : {"%0A", "&#10;"}) {
    std::string escaped = forged;
    escaped.replace(escaped.find('\n'), 1, lineFeed);
    escaped.replace(escaped.find('<'), 1, "&lt;");
    // Each message is one datagram, whatever its content.
    EXPECT_EQ(NoPlace(forged + "/"), appliance.Handle(Notification("Purged", escaped)));
  }
  ExpectUnharmed("line feeds in mount points");
}

TEST_F(HostileMessage, DotsInAMountPointAreNotResolved) {
  // The path exists, but it counts as another volume than /shares.
  EXPECT_EQ((Log{Info(":: Purged "), Info("Default:: Volume purged - ignored! ")}),
            appliance.Handle(Notification("Purged", "/shares/../shares/./")));
  EXPECT_EQ(NoPlace("../../shares/x/"), appliance.Handle(Notification("Purged", "../../shares/x")));
  ExpectUnharmed("dots in mount points");
}

} // namespace
} // namespace orva::test
