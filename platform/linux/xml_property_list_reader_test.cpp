#include "platform/linux/xml_property_list_reader.h"

#include <string>

#include <gmock/gmock.h>

namespace typhon {
namespace {

using testing::HasSubstr;
using testing::StartsWith;
using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;

PropertyListReading readDocument(std::string_view document, const PropertyListLimits& limits = {})
{
    return readPropertyList({reinterpret_cast<const std::uint8_t*>(document.data()), document.size()},
                            limits);
}

std::string documentOf(const std::string& contents)
{
    return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">" + contents + "</plist>\n";
}

PropertyListReading read(const std::string& contents, const PropertyListLimits& limits = {})
{
    return readDocument(documentOf(contents), limits);
}

void expectValue(const PropertyListReading& reading, const PropertyList& value)
{
    ASSERT_TRUE(reading.value) << reading.error;
    EXPECT_EQ(*reading.value, value);
    EXPECT_EQ(reading.error, "");
}

void expectRefused(const PropertyListReading& reading, const std::string& error)
{
    EXPECT_FALSE(reading.value);
    EXPECT_THAT(reading.error, HasSubstr(error));
}

std::string repeated(const std::string& text, std::size_t times)
{
    std::string repeated;
    for (; times != 0; --times)
        repeated += text;
    return repeated;
}

TEST(XmlPropertyListReaderTest, ReadsEveryKind)
{
    expectValue(
        read("<dict><key>a</key><array><true/><false></false><integer>-7</integer><real>2.5</real></array>"
             "<key>d</key><data>AQI=</data><key>t</key><date>2024-01-02T03:04:05Z</date>"
             "<key>s</key><string>text</string><key>e</key><dict/></dict>"),
        Dictionary{{"a", Array{true, false, -7, 2.5}},
                   {"d", Data{{1, 2}}},
                   {"t", Date{1704164645}},
                   {"s", "text"},
                   {"e", Dictionary{}}});
}

TEST(XmlPropertyListReaderTest, ReadsEmptyElements)
{
    expectValue(read("<array><string/><string></string><data/><array/><dict></dict></array>"),
                Array{"", "", Data{}, Array{}, Dictionary{}});
    expectValue(read("<dict><key/><true/></dict>"), Dictionary{{"", true}});
}

TEST(XmlPropertyListReaderTest, KeepsWhiteSpaceInTextAndIgnoresItElsewhere)
{
    expectValue(read("\n <dict>\n\t<key> a </key>\r\n<string>\n b\t</string> </dict>\n"),
                Dictionary{{" a ", "\n b\t"}});
    expectValue(read("<array><integer> 7\n</integer><real>\t1 </real><date> 1970-01-01T00:00:00Z </date>"
                     "<data>\n\tAQ\n\tI=\n</data><true> </true></array>"),
                Array{7, 1.0, Date{0}, Data{{1, 2}}, true});
}

TEST(XmlPropertyListReaderTest, JoinsReferencesSectionsAndCommentsInText)
{
    expectValue(read("<string>&lt;&#65;&#x1F600;<![CDATA[<&]]>b<!-- no -->c<?no no?></string>"),
                PropertyList("<A\xF0\x9F\x98\x80<&bc"));
}

TEST(XmlPropertyListReaderTest, ReadsKeysInAnyOrder)
{
    expectValue(read("<dict><key>b</key><true/><key>c</key><true/><key>a</key><true/></dict>"),
                Dictionary{{"a", true}, {"b", true}, {"c", true}});
}

TEST(XmlPropertyListReaderTest, SkipsADocumentTypeDeclaration)
{
    for (const auto* declaration :
         {"<!DOCTYPE plist>", "<!DOCTYPE plist SYSTEM \"file:///etc/passwd\">",
          "<!DOCTYPE plist PUBLIC \"-//Nobody//DTD PLIST 1.0//EN\" \"http://invalid.example/plist.dtd\">",
          "<!DOCTYPE plist [<!ELEMENT plist ANY><!ATTLIST plist version CDATA \"1.0\"><!-- x --><?y z?>]>"})
        expectValue(readDocument(std::string("<?xml version=\"1.0\"?>") + declaration +
                                 "<plist><string>x</string></plist>"),
                    "x");
}

TEST(XmlPropertyListReaderTest, RefusesEveryEntityDeclaration)
{
    for (const auto* declaration :
         {"<!ENTITY a \"b\">", "<!ENTITY a SYSTEM \"file:///etc/passwd\">", "<!ENTITY % a \"b\">",
          "<!ENTITY % a SYSTEM \"file:///etc/passwd\">",
          "<!NOTATION n SYSTEM \"n\"><!ENTITY a SYSTEM \"file:///etc/passwd\" NDATA n>"})
        expectRefused(readDocument(std::string("<!DOCTYPE plist [") + declaration +
                                   "]><plist><string>x</string></plist>"),
                      "line 1: an entity declaration");
}

TEST(XmlPropertyListReaderTest, RefusesUndeclaredEntities)
{
    expectRefused(read("<string>&nothing;</string>"), "undefined entity");
    // Here they might be declared outside the document, which the parser by itself would let pass.
    expectRefused(readDocument("<!DOCTYPE plist SYSTEM \"x\"><plist><string>&outside;</string></plist>"),
                  "an undeclared entity");
    expectRefused(
        readDocument("<!DOCTYPE plist [%outside; <!ENTITY a \"b\">]><plist><string>&a;</string></plist>"),
        "an undeclared entity");
}

TEST(XmlPropertyListReaderTest, BoundsAttributeDeclarations)
{
    std::string declarations;
    for (int index = 0; index < 65; ++index)
        declarations += "<!ATTLIST plist a" + std::to_string(index) + " CDATA \"\">";
    expectRefused(readDocument("<!DOCTYPE plist [" + declarations + "]><plist><true/></plist>"),
                  "too many attribute declarations");
}

TEST(XmlPropertyListReaderTest, RefusesTokensThatDoNotEnd)
{
    expectRefused(readDocument("<!-- " + std::string(4u << 20, 'x') + " --><plist><true/></plist>"),
                  "a comment, tag or instruction is too long");
    expectRefused(readDocument("<plist a=\"" + std::string(4u << 20, 'x') + "\"><true/></plist>"),
                  "a comment, tag or instruction is too long");
    // Text is no token: it arrives in pieces.
    const std::string text(4u << 20, 'x');
    expectValue(read("<string>" + text + "</string>"), text);
}

TEST(XmlPropertyListReaderTest, ReadsTheEncodingsThatTheParserKnows)
{
    expectValue(readDocument("\xEF\xBB\xBF<plist><string>\xC3\xA4</string></plist>"), "\xC3\xA4");
    expectValue(
        readDocument("<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?><plist><string>\xE4</string></plist>"),
        "\xC3\xA4");
    std::string utf16("\xFE\xFF");
    for (const char character : std::string("<plist><string>")) {
        utf16 += '\0';
        utf16 += character;
    }
    utf16 += std::string("\xD8\x3D\xDE\x00\x00\xE4", 6);
    for (const char character : std::string("</string></plist>")) {
        utf16 += '\0';
        utf16 += character;
    }
    expectValue(readDocument(utf16), "\xF0\x9F\x98\x80\xC3\xA4");
    expectRefused(readDocument("<?xml version=\"1.0\" encoding=\"EBCDIC\"?><plist><true/></plist>"),
                  "unknown encoding");
}

TEST(XmlPropertyListReaderTest, RefusesInvalidText)
{
    expectRefused(read("<string>\xC3</string>"), "not well-formed");
    expectRefused(read("<string>\xED\xA0\x80</string>"), "not well-formed");
    expectRefused(read("<string>\x01</string>"), "not well-formed");
    expectRefused(read("<string>&#0;</string>"), "reference to invalid character");
    expectRefused(read("<string>&#xD800;</string>"), "reference to invalid character");
    expectRefused(readDocument(documentOf(std::string("<string>\0</string>", 18))), "not well-formed");
}

TEST(XmlPropertyListReaderTest, RefusesUnknownElements)
{
    expectRefused(read("<null/>"), "unexpected element <null>");
    expectRefused(read("<array><Dict/></array>"), "unexpected element <Dict>");
    expectRefused(read("<set/>"), "unexpected element <set>");
    expectRefused(read("<plist><true/></plist>"), "unexpected element <plist>");
    expectRefused(read("<" + std::string(100, 'x') + "/>"),
                  "unexpected element <" + std::string(32, 'x') + ">");
    expectRefused(read("<string>a<b/></string>"), "an element <b> where only text may stand");
    expectRefused(read("<true><true/></true>"), "an element <true> where only text may stand");
}

TEST(XmlPropertyListReaderTest, RefusesAnotherRoot)
{
    expectRefused(readDocument("<dict/>"), "the root element is <dict>, not <plist>");
    expectRefused(readDocument("<html><body/></html>"), "the root element is <html>, not <plist>");
}

TEST(XmlPropertyListReaderTest, RefusesAnythingButOneValue)
{
    expectRefused(read(""), "there is no value in <plist>");
    expectRefused(readDocument("<plist/>"), "there is no value in <plist>");
    expectRefused(read("<true/><true/>"), "more than one value");
    expectRefused(read("<dict/><array/>"), "more than one value");
    expectRefused(read("<key>a</key>"), "a key outside a dictionary");
}

TEST(XmlPropertyListReaderTest, RefusesTextBetweenElements)
{
    expectRefused(read("x<true/>"), "text between elements");
    expectRefused(read("<array>x</array>"), "text between elements");
    expectRefused(read("<dict><key>a</key>x<true/></dict>"), "text between elements");
    expectRefused(read("<true>x</true>"), "text in a boolean");
    expectRefused(read("<array>\xC2\xA0</array>"), "text between elements");
}

TEST(XmlPropertyListReaderTest, RefusesDictionariesThatDoNotPairUp)
{
    expectRefused(read("<dict><true/></dict>"), "a value without a key");
    expectRefused(read("<dict><dict/></dict>"), "a value without a key");
    expectRefused(read("<dict><key>a</key></dict>"), "a key without a value");
    expectRefused(read("<dict><key>a</key><key>b</key><true/></dict>"), "a key without a value");
    expectRefused(read("<array><key>a</key></array>"), "a key outside a dictionary");
}

TEST(XmlPropertyListReaderTest, RefusesDuplicateKeys)
{
    expectRefused(read("<dict><key>a</key><true/><key>a</key><true/></dict>"), "a duplicate key");
    expectRefused(read("<dict><key>b</key><dict/><key>a</key><true/><key>b</key><dict/></dict>"),
                  "a duplicate key");
    expectValue(read("<array><dict><key>a</key><true/></dict><dict><key>a</key><true/></dict></array>"),
                Array{Dictionary{{"a", true}}, Dictionary{{"a", true}}});
}

TEST(XmlPropertyListReaderTest, RefusesMalformedScalars)
{
    expectRefused(read("<integer>seven</integer>"), "an integer");
    expectRefused(read("<integer/>"), "an integer");
    expectRefused(read("<integer>9223372036854775808</integer>"), "beyond 64 bits");
    expectRefused(read("<real>one</real>"), "a real");
    expectRefused(read("<date>yesterday</date>"), "a malformed date");
    expectRefused(read("<data>AQ!</data>"), "malformed base64 data");
    expectRefused(read("<data>AQ</data>"), "incomplete base64 data");
    expectValue(read("<array><integer>-0x10</integer><integer>+5</integer></array>"), Array{-16, 5});
}

TEST(XmlPropertyListReaderTest, RefusesTruncatedInputAndTrailingGarbage)
{
    const auto document = documentOf("<dict><key>a</key><string>b</string></dict>");
    for (std::size_t length = 0; length + 2 < document.size(); ++length)
        EXPECT_FALSE(readDocument(document.substr(0, length)).value) << length;
    expectRefused(readDocument(document + "x"), "junk after document element");
    expectRefused(readDocument(document + document), "junk after document element");
    expectRefused(readDocument(document + "<plist/>"), "junk after document element");
    expectRefused(readDocument(""), "no element found");
}

TEST(XmlPropertyListReaderTest, SaysInWhichLine)
{
    EXPECT_THAT(read("\n<array>\n<true/>\n<nothing/>\n</array>").error, StartsWith("line 5: "));
    EXPECT_THAT(read("\n<array>").error, StartsWith("line 3: mismatched tag"));
}

TEST(XmlPropertyListReaderTest, BoundsDepth)
{
    const PropertyListLimits limits{.depth = 3};
    expectValue(read("<array><array><array/></array></array>", limits), Array{Array{Array{}}});
    expectRefused(read("<array><array><array><array/></array></array></array>", limits), "nested too deeply");
    expectRefused(read("<dict><key>a</key>" + repeated("<array>", 3), limits), "nested too deeply");
    expectRefused(read(repeated("<array>", 1'000'000)), "nested too deeply");
}

TEST(XmlPropertyListReaderTest, CountsValuesAndKeys)
{
    const auto dictionary = "<dict><key>a</key><true/><key>b</key><array><true/></array></dict>";
    EXPECT_TRUE(read(dictionary, {.values = 6}).value);
    expectRefused(read(dictionary, {.values = 5}), "too many values");
    expectRefused(read("<dict><key>a</key>", {.values = 1}), "too many values");
}

TEST(XmlPropertyListReaderTest, ReadsTheSameInBlocksOfAnySize)
{
    const auto document = documentOf("<dict><key>\xC3\xA4</key><data> AQ ID </data><key>b</key>"
                                     "<string>\xF0\x9F\x98\x80&amp;x</string></dict>");
    const auto whole = readDocument(document);
    ASSERT_TRUE(whole.value) << whole.error;
    for (std::size_t size = 1; size < 20; ++size) {
        XmlPropertyListReader reader({});
        for (std::size_t at = 0; at < document.size(); at += size) {
            const auto block = std::string_view(document).substr(at, size);
            EXPECT_TRUE(reader.feed({reinterpret_cast<const std::uint8_t*>(block.data()), block.size()}));
        }
        EXPECT_EQ(reader.finish().value, whole.value);
    }
}

TEST(XmlPropertyListReaderTest, StopsAtTheFirstError)
{
    XmlPropertyListReader reader({});
    const std::string_view wrong = "<plist><wrong/>";
    const std::string_view rest = "<true/></plist>";
    EXPECT_FALSE(reader.feed({reinterpret_cast<const std::uint8_t*>(wrong.data()), wrong.size()}));
    EXPECT_FALSE(reader.feed({reinterpret_cast<const std::uint8_t*>(rest.data()), rest.size()}));
    expectRefused(reader.finish(), "line 1: unexpected element <wrong>");
}

}  // namespace
}  // namespace typhon
