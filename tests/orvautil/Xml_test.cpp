#include "orvautil/Xml.h"

#include "support/XmlPlatform.h"

#include <gtest/gtest.h>

#include <xercesc/dom/DOMDocument.hpp>
#include <xercesc/dom/DOMElement.hpp>
#include <xercesc/framework/MemBufInputSource.hpp>
#include <xercesc/parsers/XercesDOMParser.hpp>
#include <xercesc/util/TranscodingException.hpp>

#include <string>

namespace orva::util {
namespace {

/// An element with attributes, parsed.
class Attributes {
public:
  explicit Attributes(const std::string& document) {
    const auto* const bytes = reinterpret_cast<const XMLByte*>(document.data());
    parser_.parse(xercesc::MemBufInputSource(bytes, document.size(), "test"));
  }

  std::string Value(const std::string& name) const {
    return GetAttributeValue(name, parser_.getDocument()->getDocumentElement()->getAttributes());
  }

  xercesc::DOMDocument& Document() { return *parser_.getDocument(); }

private:
  mutable xercesc::XercesDOMParser parser_;
};

class Xml : public testing::Test {
private:
  test::XmlPlatform platform_;
};

TEST_F(Xml, TextBecomesUtf8) {
  EXPECT_EQ(XMLCh2string(u"ORVANotification"), "ORVANotification");
  EXPECT_EQ(XMLCh2string(u"\u00e9\u20ac"), "\xc3\xa9\xe2\x82\xac");
  EXPECT_EQ(XMLCh2string(u"\U0001f4f7"), "\xf0\x9f\x93\xb7");
}

TEST_F(Xml, NullIsAnEmptyText) {
  EXPECT_EQ(XMLCh2string(nullptr), "");
  EXPECT_EQ(XMLCh2string(u""), "");
}

TEST_F(Xml, LongTextsAreConvertedCompletely) {
  EXPECT_EQ(XMLCh2string(std::u16string(100'000, u'\u20ac').c_str()).size(), 300'000U);
}

TEST_F(Xml, TextThatEndsInsideASurrogatePairIsAnException) {
  EXPECT_THROW(XMLCh2string(u"a\xd800"), xercesc::TranscodingException);
}

TEST_F(Xml, AttributeValuesAreFoundByName) {
  const Attributes attributes("<a Name='Photos' MountPoint='/shares/Photos'/>");
  EXPECT_EQ(attributes.Value("Name"), "Photos");
  EXPECT_EQ(attributes.Value("MountPoint"), "/shares/Photos");
}

TEST_F(Xml, AttributeValuesAreUtf8WithReferencesResolved) {
  const Attributes attributes("<a n\xc3\xa9='x &amp; &#x20ac;'/>");
  EXPECT_EQ(attributes.Value("n\xc3\xa9"), "x & \xe2\x82\xac");
}

TEST_F(Xml, AttributeNamesMustMatchCompletely) {
  const Attributes attributes("<a Name='x'/>");
  EXPECT_EQ(attributes.Value("name"), "");
  EXPECT_EQ(attributes.Value("Nam"), "");
  EXPECT_EQ(attributes.Value("Names"), "");
}

TEST_F(Xml, AnAbsentAttributeIsEmpty) {
  EXPECT_EQ(Attributes("<a Name='x'/>").Value("Other"), "");
  EXPECT_EQ(Attributes("<a Name=''/>").Value("Name"), "");
  EXPECT_EQ(Attributes("<a/>").Value("Name"), "");
}

TEST_F(Xml, ANodeWithoutAttributesHasNoValues) {
  Attributes attributes("<a/>");
  EXPECT_EQ(GetAttributeValue("Name", attributes.Document().getAttributes()), "");
  EXPECT_EQ(GetAttributeValue("Name", nullptr), "");
}

} // namespace
} // namespace orva::util
