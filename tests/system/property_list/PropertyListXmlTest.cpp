#include <gtest/gtest.h>

#include "system/property_list/PropertyListPlainXmlReader.h"
#include "system/property_list/PropertyListXmlReader.h"
#include "tests/system/property_list/PropertyListSamples.h"

namespace appsync {
namespace {

constexpr std::string_view kDeclaration = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n";

std::string written(const PropertyList& value) {
    return textOf(*serialize(value, PropertyListFormat::Xml));
}

PropertyList content(std::string_view value) {
    auto result = parse(xml(value));
    return result ? std::move(*result) : PropertyList("refused: " + result.error().description());
}

/// The refusal of a document around this value, whose text begins in line 2.
std::string xmlProblem(std::string_view value) {
    const std::string all = refusal(xml(value));
    const std::string_view prefix = "XML property list, ";
    return all.starts_with(prefix) ? all.substr(prefix.size()) : all;
}

TEST(XmlPropertyListWriter, WritesTheUsualForm) {
    const auto value = PropertyList::map({{"a", PropertyList::array({1, true, "x&y"})},
                                          {"b", Bytes{1, 2, 3}},
                                          {"c", PropertyList::map()}});
    EXPECT_EQ(
        written(value),
        std::string(kDeclaration) +
            "<plist version=\"1.0\">\n<dict>\n\t<key>a</key>\n\t<array>\n"
            "\t\t<integer>1</integer>\n\t\t<true/>\n\t\t<string>x&amp;y</string>\n\t</array>\n"
            "\t<key>b</key>\n\t<data>\n\tAQID\n\t</data>\n\t<key>c</key>\n\t<dict/>\n"
            "</dict>\n</plist>\n");
}

TEST(XmlPropertyListWriter, WritesCarriageReturnsAsReferences) {
    EXPECT_NE(written("a\r\nb").find("<string>a&#13;\nb</string>"), std::string::npos);
}

TEST(XmlPropertyListWriter, WritesNoDocumentType) {
    EXPECT_EQ(written(true).find("<!"), std::string::npos);
}

TEST(XmlPropertyListWriter, RefusesCharactersThatXmlCannotCarry) {
    const std::vector<std::pair<std::string, std::string>> cases = {
        {std::string("a\0b", 3), "U+0000"},
        {"a\x01", "U+0001"},
        {"a\x1F", "U+001F"},
        {"a\xEF\xBF\xBE", "U+FFFE"},
        {"a\xEF\xBF\xBF", "U+FFFF"}};
    for (const auto& [text, name] : cases) {
        const auto result = serialize(PropertyList::array({text}), PropertyListFormat::Xml);
        ASSERT_FALSE(result.ok()) << name;
        EXPECT_EQ(result.error().description(),
                  "the value at [0]: XML cannot carry the character " + name +
                      " at byte 1 of the text; write it as binary");
        EXPECT_EQ(roundTrip(text, PropertyListFormat::Binary), PropertyList(text));
    }
}

TEST(XmlPropertyListWriter, RefusesDatesThatXmlCannotCarry) {
    for (const double seconds : {-63113904001.0, -63113904000.5, 252423993600.0, 1e300}) {
        const PropertyList date = PropertyList::Date{seconds};
        const auto result = serialize(date, PropertyListFormat::Xml);
        ASSERT_FALSE(result.ok()) << seconds;
        EXPECT_EQ(result.error().description(),
                  "the outermost value: XML cannot carry this date (years 0001 to 9999 only); "
                  "write it as binary");
        EXPECT_EQ(roundTrip(date, PropertyListFormat::Binary), date);
    }
}

TEST(XmlPropertyListDates, AreWrittenInUtcRoundedDownToTheSecond) {
    const auto spelled = [](double seconds) {
        const std::string text = written(PropertyList::Date{seconds});
        const std::size_t begin = text.find("<date>") + 6;
        return text.substr(begin, text.find('<', begin) - begin);
    };
    EXPECT_EQ(spelled(0), "2001-01-01T00:00:00Z");
    EXPECT_EQ(spelled(-1), "2000-12-31T23:59:59Z");
    EXPECT_EQ(spelled(730902645), "2024-02-29T12:30:45Z");
    EXPECT_EQ(spelled(730902645.25), "2024-02-29T12:30:45Z");
    EXPECT_EQ(spelled(730902645.999999), "2024-02-29T12:30:45Z");
    EXPECT_EQ(spelled(-0.25), "2000-12-31T23:59:59Z");
    EXPECT_EQ(spelled(-63113904000.0), "0001-01-01T00:00:00Z");
    EXPECT_EQ(spelled(252423993599.0), "9999-12-31T23:59:59Z");
    EXPECT_EQ(spelled(252423993599.75), "9999-12-31T23:59:59Z");
}

TEST(XmlPropertyListDates, ThatWereReadAreWrittenBackAsTheyWere) {
    for (const char* date : {"0001-01-01T00:00:00Z", "1900-02-28T23:59:59Z", "2000-02-29T00:00:01Z",
                             "2009-02-13T23:31:09Z", "9999-12-31T23:59:59Z"}) {
        const std::string element = "<date>" + std::string(date) + "</date>";
        EXPECT_NE(written(content(element)).find(element), std::string::npos) << date;
    }
}

TEST(XmlPropertyListDates, ThatAreNoPointInTimeAreNotWritten) {
    for (const double seconds :
         {std::numeric_limits<double>::quiet_NaN(), std::numeric_limits<double>::infinity()}) {
        const auto result = serialize(PropertyList::Date{seconds}, PropertyListFormat::Xml);
        ASSERT_FALSE(result.ok()) << seconds;
        EXPECT_NE(result.error().description().find("no point in time"), std::string::npos);
    }
}

TEST(XmlPropertyListDates, AreReadStrictly) {
    EXPECT_EQ(content("<date> 2001-01-02T00:00:00Z\n</date>"),
              PropertyList(PropertyList::Date{86400}));
    for (const std::string bad :
         {"2001-02-29T00:00:00Z", "2001-13-01T00:00:00Z", "2001-00-01T00:00:00Z",
          "2001-01-01T24:00:00Z", "2001-01-01T00:60:00Z", "2001-01-01T00:00:60Z",
          "0000-01-01T00:00:00Z", "2001-01-01T00:00:00", "2001-01-01 00:00:00Z", "2001-01-01",
          "01-01-01T00:00:00Z", "2001-01-01T00:00:00.Z", "2001-01-01T00:00:09.25Z",
          "2001-01-01T00:00:00+0", "", "x"}) {
        EXPECT_NE(xmlProblem("<date>" + bad + "</date>").find("expected a date"), std::string::npos)
            << bad;
    }
}

TEST(XmlPropertyListIntegers, AreReadInEveryForm) {
    EXPECT_EQ(content("<integer> -9223372036854775808 </integer>"), PropertyList(INT64_MIN));
    EXPECT_EQ(content("<integer>18446744073709551615</integer>"), PropertyList(UINT64_MAX));
    EXPECT_EQ(content("<integer>+5</integer>"), PropertyList(5));
    EXPECT_EQ(content("<integer>0xfF</integer>"), PropertyList(255));
    EXPECT_EQ(content("<integer>&#49;2</integer>"), PropertyList(12));
}

TEST(XmlPropertyListIntegers, AreRefusedWhereTheyGoWrong) {
    EXPECT_EQ(xmlProblem("<integer>12a</integer>"),
              "line 2, column 12: expected an integer of at most 64 bits");
    for (const std::string bad : {"18446744073709551616", "-9223372036854775809", "", "-", "--1",
                                  "1 2", "1.0", "0x", "0xg", "1e3"}) {
        EXPECT_NE(xmlProblem("<integer>" + bad + "</integer>").find("expected an integer"),
                  std::string::npos)
            << bad;
    }
}

TEST(XmlPropertyListReals, AreReadInEveryForm) {
    const double infinity = std::numeric_limits<double>::infinity();
    EXPECT_EQ(content("<real> 1.5e3 </real>"), PropertyList(1500.0));
    EXPECT_EQ(content("<real>7</real>"), PropertyList(7.0));
    EXPECT_EQ(content("<real>+infinity</real>"), PropertyList(infinity));
    EXPECT_EQ(content("<real>-INF</real>"), PropertyList(-infinity));
    EXPECT_EQ(content("<real>nan</real>"), PropertyList(std::numeric_limits<double>::quiet_NaN()));
    EXPECT_EQ(xmlProblem("<real>1.5x</real>"), "line 2, column 10: expected a number");
    for (const std::string bad : {"", "x", "1e999", "--1", "+-1", "1,5", "0x10"}) {
        EXPECT_NE(xmlProblem("<real>" + bad + "</real>").find("expected a number"),
                  std::string::npos)
            << bad;
    }
}

TEST(XmlPropertyListData, IsReadWithAnyWhiteSpace) {
    EXPECT_EQ(content("<data> A Q\n\tI\rD </data>"), PropertyList(Bytes{1, 2, 3}));
    EXPECT_EQ(content("<data>AQI=</data>"), PropertyList(Bytes{1, 2}));
    EXPECT_EQ(content("<data>AQ==</data>"), PropertyList(Bytes{1}));
    EXPECT_EQ(content("<data/>"), PropertyList(Bytes{}));
}

TEST(XmlPropertyListData, IsRefusedWhereItGoesWrong) {
    EXPECT_EQ(xmlProblem("<data>AQ*D</data>"), "line 2, column 9: expected base64");
    EXPECT_EQ(xmlProblem("<data>AQID\n  AQ</data>"), "line 3, column 5: expected base64");
    for (const std::string bad :
         {"A", "AQI", "AQ=", "=", "AQID=", "AQ==AQ==", "AR==", "AQJ=", "A==="}) {
        EXPECT_NE(xmlProblem("<data>" + bad + "</data>").find("expected base64"), std::string::npos)
            << bad;
    }
}

TEST(XmlPropertyListTexts, KeepWhiteSpace) {
    EXPECT_EQ(content("<string> \n </string>"), PropertyList(" \n "));
    EXPECT_EQ(content("<string> <!-- c --> </string>"), PropertyList("  "));
    EXPECT_EQ(content("<string> <![CDATA[ x ]]> </string>"), PropertyList("  x  "));
    EXPECT_EQ(content("<string>\n<?p?>a</string>"), PropertyList("\na"));
    EXPECT_EQ(content("<string/>"), PropertyList(""));
    EXPECT_EQ(content("<string ></string >"), PropertyList(""));
}

TEST(XmlPropertyListTexts, HaveTheirLineEndsMadeNewlines) {
    EXPECT_EQ(content("<string>a\r\nb\rc&#13;d</string>"), PropertyList("a\nb\nc\rd"));
    EXPECT_EQ(content("<string><![CDATA[a\r\nb&#13;]]></string>"), PropertyList("a\nb&#13;"));
}

TEST(XmlPropertyListTexts, HaveTheirReferencesExpanded) {
    EXPECT_EQ(content("<string>&lt;&gt;&amp;&quot;&apos;</string>"), PropertyList("<>&\"'"));
    EXPECT_EQ(content("<string>&#65;&#x20aC;&#x1F600;</string>"),
              PropertyList("A\u20ac\U0001F600"));
    EXPECT_EQ(content("<string>&amp;lt;</string>"), PropertyList("&lt;"));
    EXPECT_EQ(content("<string><![CDATA[&lt;]]></string>"), PropertyList("&lt;"));
    EXPECT_EQ(content("<dict><key>&amp;</key><true/></dict>"), PropertyList::map({{"&", true}}));
}

TEST(XmlPropertyListTexts, RefuseReferencesThatStandForNothing) {
    EXPECT_EQ(xmlProblem("<string>ab&foo;</string>"),
              "line 2, column 11: expected &lt; &gt; &amp; &quot; &apos; or a reference to a "
              "character that XML can carry");
    for (const std::string bad :
         {"&", "&;", "&#;", "&#x;", "&#0;", "&#1;", "&#xD800;", "&#x110000;", "&#99999999999;",
          "&#xFFFF;", "&#-5;", "&#65", "&lt", "&LT;", "& lt;", "&#X41;", "&#x4g;"}) {
        EXPECT_NE(xmlProblem("<string>" + bad + "</string>").find("column 9: expected &lt;"),
                  std::string::npos)
            << bad;
        EXPECT_NE(xmlProblem("<dict><key>" + bad + "</key><true/></dict>").find("column 12"),
                  std::string::npos)
            << bad;
    }
}

TEST(XmlPropertyListEntities, AreNeverDeclared) {
    const std::string document =
        "<?xml version=\"1.0\"?>\n<!DOCTYPE plist [<!ENTITY a \"x\"><!ENTITY b SYSTEM "
        "\"file:///etc/passwd\">]>\n";
    EXPECT_EQ(*parse(document + xml("<string>x</string>")), PropertyList("x"));
    EXPECT_NE(
        refusal(document + xml("<string>&a;</string>")).find("line 4, column 9: expected &lt;"),
        std::string::npos);
    EXPECT_NE(
        refusal(document + xml("<string>&b;</string>")).find("line 4, column 9: expected &lt;"),
        std::string::npos);
}

TEST(XmlPropertyListEntities, DoNotLaugh) {
    std::string document = "<!DOCTYPE plist [<!ENTITY l0 \"ha\">";
    for (int i = 1; i < 20; ++i) {
        const std::string inner = "&l" + std::to_string(i - 1) + ";";
        document += "<!ENTITY l" + std::to_string(i) + " \"" + inner + inner + inner + "\">";
    }
    EXPECT_NE(refusal(document + "]>\n" + xml("<string>&l19;</string>")).find("line 3, column 9"),
              std::string::npos);
}

TEST(XmlPropertyListForm, SkipsWhatHasNoMeaning) {
    const std::string document =
        "\xEF\xBB\xBF<?xml version='1.0' encoding='utf-8' standalone='yes'?>\r\n<!-- <plist> -->\n"
        "<!DOCTYPE plist PUBLIC \"a>b\" \"c\">\n<?note x?>\n<plist version=\"1.0\" extra='1'>\n"
        "<!-- c --><array a='b'><?p?><true /><!-- <false/> --> <false></false></array>\n</plist >\n"
        "<!-- end -->\n";
    EXPECT_EQ(refusal(document), "read");
    EXPECT_EQ(*parse(document), PropertyList::array({true, false}));
}

TEST(XmlPropertyListForm, RefusesWhatIsNotAPropertyList) {
    EXPECT_EQ(
        refusal(""),
        "XML property list, line 1, column 1: expected a property list, found no bytes at all");
    EXPECT_EQ(refusal("hello"),
              "XML property list, line 1, column 1: expected <plist>, found text");
    EXPECT_EQ(refusal("\n <html/>"), "XML property list, line 2, column 2: expected <plist>");
    EXPECT_EQ(
        refusal(" \n"),
        "XML property list, line 2, column 1: expected <plist>, found the end of the document");
    EXPECT_EQ(refusal("<plist/>"),
              "XML property list, line 1, column 1: expected one value inside <plist>");
    EXPECT_EQ(refusal("<plist><true/></plist>x"),
              "XML property list, line 1, column 23: expected <plist>, found text");
    EXPECT_EQ(
        refusal("<plist><true/></plist>\n<plist/>"),
        "XML property list, line 2, column 1: expected the end of the document after </plist>");
}

TEST(XmlPropertyListForm, RefusesOtherEncodings) {
    EXPECT_EQ(refusal("<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?><plist><true/></plist>"),
              "XML property list, line 1, column 31: expected the encoding UTF-8, found "
              "'ISO-8859-1'");
    EXPECT_NE(refusal("\xFF\xFE<\0p\0l\0").find("expected an XML document in UTF-8"),
              std::string::npos);
}

TEST(XmlPropertyListForm, RefusesEverythingOutOfPlace) {
    const std::vector<std::pair<std::string, std::string>> cases = {
        {"<true/><true/>", "line 2, column 8: expected </plist> after the one value"},
        {"<true/>x", "line 2, column 8: expected a value, found text"},
        {"<foo/>",
         "line 2, column 1: expected a value (string, dict, array, integer, real, true, "
         "false, date or data), found <foo>"},
        {"<key>x</key>",
         "line 2, column 1: expected a value (string, dict, array, integer, real, "
         "true, false, date or data), found <key>"},
        {"<true>x</true>", "line 2, column 1: expected no text inside a boolean"},
        {"<array>\n x</array>", "line 3, column 2: expected a value or </array>, found text"},
        {"<string><b/></string>", "line 2, column 9: expected text, found <b>"},
        {"<string>a<b/></string>", "line 2, column 10: expected text, found <b>"},
        {"<dict>\n<true/></dict>", "line 3, column 1: expected <key> or </dict>, found <true>"},
        {"<dict><key>a</key></dict>",
         "line 2, column 7: expected a value after this key, found </dict>"},
        {"<dict><key>a</key><key>b</key></dict>",
         "line 2, column 19: expected a value (string, dict, array, integer, real, true, false, "
         "date or data), found <key>"},
        {"<dict>x<key>a</key><true/></dict>",
         "line 2, column 7: expected <key> or </dict>, found text"},
    };
    for (const auto& [value, expected] : cases) EXPECT_EQ(xmlProblem(value), expected);
}

TEST(XmlPropertyListForm, RefusesEqualKeys) {
    EXPECT_EQ(xmlProblem("<dict><key>a</key><true/><key>b</key><true/>\n"
                         "<key>&#97;</key><false/></dict>"),
              "line 3, column 1: expected a key that the map does not have yet");
}

TEST(XmlPropertyListForm, RefusesDamagedMarkup) {
    const std::vector<std::pair<std::string, std::string>> cases = {
        {"<string>x</integer>", "expected the end tag of the element that is still open"},
        {"<string", "expected a start tag that ends with '>'"},
        {"<!-- x", "expected a comment that ends with '-->'"},
        {"<![CDATA[ x", "expected a CDATA section that ends with ']]>'"},
        {"<?p", "expected a processing instruction that ends with '?>'"},
        {"<true a=b/>", "expected an attribute with a quoted value"},
        {"<>", "expected a tag"},
    };
    for (const auto& [value, expected] : cases) {
        EXPECT_NE(refusal("<plist>" + value).find(expected), std::string::npos)
            << value << ": " << refusal("<plist>" + value);
    }
}

TEST(XmlPropertyListForm, RefusesWhatIsNotUtf8AndSaysWhere) {
    EXPECT_EQ(xmlProblem("<string>\u20acx\xFFy</string>"),
              "line 2, column 11: expected UTF-8, found a byte that is not");
    EXPECT_EQ(xmlProblem("<string>a\r\rb\x01</string>"),
              "line 4, column 2: expected a character that XML can carry, found U+0001");
    EXPECT_EQ(xmlProblem(std::string("<string>") + '\0' + "</string>"),
              "line 2, column 9: expected a character that XML can carry, found U+0000");
    EXPECT_EQ(xmlProblem("<string>" + std::string(100, 'x') + "\xED\xA0\x80</string>"),
              "line 2, column 109: expected UTF-8, found a byte that is not");
}

TEST(XmlPropertyListErrors, CarryLineAndColumnForPrograms) {
    const auto result = parse(xml("<foo/>"));
    ASSERT_FALSE(result.ok());
    EXPECT_EQ(result.error().domain, kPropertyListErrorDomain);
    EXPECT_EQ(*result.error().userInfo.find("line"), PropertyList(2));
    EXPECT_EQ(*result.error().userInfo.find("column"), PropertyList(1));
}

std::string nestedXml(std::size_t depth, std::string_view open, std::string_view close) {
    std::string text;
    for (std::size_t i = 0; i < depth; ++i) text += open;
    for (std::size_t i = 0; i < depth; ++i) text += close;
    return text;
}

TEST(XmlPropertyListDepth, EndsAt128) {
    EXPECT_EQ(content(nestedXml(128, "<array>", "</array>")), nestedArrays(128));
    EXPECT_EQ(xmlProblem(nestedXml(129, "<array>", "</array>")),
              "line 2, column 897: expected at most 128 containers in one another");
    EXPECT_EQ(xmlProblem(nestedXml(129, "<dict><key>a</key>", "</dict>")),
              "line 2, column 2305: expected at most 128 containers in one another");
}

TEST(XmlPropertyListDepth, AMillionContainersAreRefused) {
    EXPECT_NE(xmlProblem(nestedXml(1'000'000, "<array>", "</array>")).find("at most 128"),
              std::string::npos);
    EXPECT_NE(xmlProblem(nestedXml(1'000'000, "<array>", "")).find("still open"),
              std::string::npos);
}

TEST(XmlPropertyListDamage, ADocumentCutOffAnywhereIsRefused) {
    const std::string whole = written(todoList(3));
    for (std::size_t size = 0; size + 1 < whole.size(); ++size) {
        const auto result = parse(whole.substr(0, size));
        ASSERT_FALSE(result.ok()) << size;
        ASSERT_NE(result.error().description().find("line "), std::string::npos) << size;
    }
}

TEST(XmlPropertyListDamage, AnyByteReplacedIsReadOrRefusedAlikeByBothReaders) {
    const std::string whole = written(PropertyList::map(
        {{"k", PropertyList::array({1, 0.5, true, "a&b", PropertyList::Date{1}, Bytes{1}})}}));
    for (std::size_t i = 0; i < whole.size(); ++i) {
        for (int byte = 0; byte < 256; ++byte) {
            Bytes changed = bytesOf(whole);
            changed[i] = static_cast<std::uint8_t>(byte);
            const auto plain = readPlainXmlPropertyList(changed);
            const auto full = readXmlPropertyList(changed);
            if (plain) {
                ASSERT_TRUE(full.ok() && *plain == *full) << i << ' ' << byte;
            } else if (!full) {
                ASSERT_NE(full.error().description().find("line "), std::string::npos);
            }
        }
    }
}

TEST(PlainXmlPropertyListReader, ReadsWhatTheWriterWrites) {
    for (const PropertyList& value : sampleValues()) {
        const auto read = readPlainXmlPropertyList(bytesOf(written(value)));
        ASSERT_TRUE(read.has_value()) << written(value);
        EXPECT_EQ(*read, value);
    }
}

TEST(PlainXmlPropertyListReader, LeavesOddDocumentTypesToTheOther) {
    const std::string list = xml("<true/>");
    EXPECT_TRUE(readPlainXmlPropertyList(bytesOf("<!DOCTYPE plist \"a\">" + list)).has_value());
    for (const std::string odd : {"<!DOCTYPE plist [<!ENTITY a \"x\">]>", "<!DOCTYPE \"a>",
                                  "<!DOCTYPE 'a>", "<!DOCTYPE a<!DOCTYPE b>", "<!DOCTYPE"}) {
        EXPECT_FALSE(readPlainXmlPropertyList(bytesOf(odd + list)).has_value()) << odd;
    }
}

TEST(FullXmlPropertyListReader, ReadsWhatTheWriterWrites) {
    for (const PropertyList& value : sampleValues()) {
        const auto read = readXmlPropertyList(bytesOf(written(value)));
        ASSERT_TRUE(read.ok()) << written(value);
        EXPECT_EQ(*read, value);
    }
}

}  // namespace
}  // namespace appsync
