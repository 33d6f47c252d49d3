// SPDX-License-Identifier: Apache-2.0
// The values of property lists in both forms.
#include "foundation/plist/PropertyList.h"

#include "foundation/cbor/Hex.h"
#include "foundation/plist/PropertyListWriter.h"
#include "foundation/values/GeneratedValues.h"

#include <algorithm>
#include <cmath>
#include <gtest/gtest.h>
#include <limits>
#include <rapidcheck/gtest.h>

namespace foundation {
namespace {

using support::binaryPropertyList;
using support::BinaryPropertyList;
using support::utf16Bytes;
using support::xmlDocument;
using support::xmlPropertyList;

Value read(std::string_view bytes)
{
    const auto value = readPropertyList(bytes);
    EXPECT_TRUE(value) << value.error().text;
    return value.value_or(Value());
}

Value readXml(std::string_view elements)
{
    return read(xmlDocument(elements));
}

// The one object of a binary list.
Value readObject(std::string_view hex)
{
    return read(BinaryPropertyList{.objects = {fromHex(hex)}}.bytes());
}

void expectNumber(const Value& value, Number expected)
{
    EXPECT_EQ(value, Value(expected));
    ASSERT_TRUE(value.number());
    EXPECT_EQ(value.number()->kind(), expected.kind()) << expected.text();
}

constexpr std::int64_t least = std::numeric_limits<std::int64_t>::min();
constexpr std::int64_t most = std::numeric_limits<std::int64_t>::max();
constexpr std::uint64_t mostUnsigned = std::numeric_limits<std::uint64_t>::max();

// --- files of another program

// All values that both forms have.
Value everything()
{
    return Dictionary{
        {"array", Array{1, "two", Array(), Dictionary()}},
        {"data", Data{String(std::string_view("\x00\x01\xFE\xFF kesto", 10))}},
        {"date", Date{1'772'368'200}},
        {"false", false},
        {"huge", mostUnsigned},
        {"least", least},
        {"real", 0.1},
        {"text", "a < b & \"c\" é€😀"},
        {"true", true},
    };
}

TEST(PropertyList, ReadsXmlThatAnotherProgramWrote)
{
    EXPECT_EQ(read(R"(<?xml version="1.0" encoding="UTF-8"?>
<!DOCTYPE plist PUBLIC "-//Somebody//DTD PLIST 1.0//EN" "http://dtd.invalid/PropertyList-1.0.dtd">
<plist version="1.0">
<dict>
	<key>array</key>
	<array>
		<integer>1</integer>
		<string>two</string>
		<array/>
		<dict/>
	</array>
	<key>data</key>
	<data>
	AAH+/yBrZXN0bw==
	</data>
	<key>date</key>
	<date>2026-03-01T12:30:00Z</date>
	<key>false</key>
	<false/>
	<key>huge</key>
	<integer>18446744073709551615</integer>
	<key>least</key>
	<integer>-9223372036854775808</integer>
	<key>real</key>
	<real>0.1</real>
	<key>text</key>
	<string>a &lt; b &amp; "c" é€😀</string>
	<key>true</key>
	<true/>
</dict>
</plist>
)"),
              Value(everything()));
}

TEST(PropertyList, ReadsABinaryOneThatAnotherProgramWrote)
{
    EXPECT_EQ(read(fromHex(
                  "62706c6973743030d90102030405060708090a0f10111213141516556172726179546461746154646174655566616c736554"
                  "68756765556c65617374547265616c54746578745474727565a40b0c0d0e10015374776fa0d04a0001feff206b6573746f33"
                  "41c7aa346400000008140000000000000000ffffffffffffffff138000000000000000233fb999999999999a6f1010006100"
                  "20003c00200062002000260020002200630022002000e920acd83dde0009081b21262b31363c41464b5052565758636c6d7e"
                  "8790b300000000000001010000000000000017000000000000000000000000000000b4")),
              Value(everything()));
}

// --- both forms

// The value with `change` applied to every key and to every value that is not a container.
template <typename Change> Value withEach(const Value& value, Change change)
{
    if (const auto array = value.array()) {
        std::vector<Value> values;
        for (const Value& element : *array)
            values.push_back(withEach(element, change));
        return Array(std::move(values));
    }
    if (const auto dictionary = value.dictionary()) {
        Dictionary::Entries entries;
        for (const auto& [key, element] : *dictionary)
            entries.push_back({*change(key).string(), withEach(element, change)});
        return Dictionary(std::move(entries));
    }
    return change(value);
}

// Whole seconds survive the other epoch and text; years have four digits.
Value withPlainDate(const Value& value)
{
    return value.date() ? Date{std::floor(std::fmod(value.date()->secondsSince1970, 6e10))} : value;
}

// XML has neither null nor NUL.
Value sayableInXml(const Value& value)
{
    if (!value.isNull() && !value.string())
        return withPlainDate(value);
    std::string text(value.stringView());
    std::erase(text, '\0');
    return text;
}

RC_GTEST_PROP(PropertyListProperty, XmlHoldsWhatWasWritten, ())
{
    const Value value = withEach(*generated::value(), sayableInXml);
    const auto read = readPropertyList(xmlPropertyList(value));
    RC_ASSERT(read.has_value());
    RC_ASSERT(*read == value);
}

RC_GTEST_PROP(PropertyListProperty, ABinaryOneHoldsWhatWasWritten, ())
{
    const Value value = withEach(*generated::value(), withPlainDate);
    const auto read = readPropertyList(binaryPropertyList(value));
    RC_ASSERT(read.has_value());
    RC_ASSERT(*read == value);
}

TEST(PropertyList, TheLastOfRepeatedKeysCounts)
{
    const Value expected = Dictionary{{"a", 3}, {"b", 2}};
    EXPECT_EQ(readXml("<dict><key>a</key><integer>1</integer><key>b</key><integer>2</integer>"
                      "<key>a</key><integer>3</integer></dict>"),
              expected);
    EXPECT_EQ(read(BinaryPropertyList{.objects = {fromHex("d3010201030405"),
                                                  "\x51"
                                                  "a",
                                                  "\x51"
                                                  "b",
                                                  fromHex("1001"), fromHex("1002"), fromHex("1003")}}
                       .bytes()),
              expected);
}

// --- XML

TEST(XmlPropertyList, Integers)
{
    expectNumber(readXml("<integer>0</integer>"), Number(0));
    expectNumber(readXml("<integer> \n+42\t</integer>"), Number(42));
    expectNumber(readXml("<integer>-42</integer>"), Number(-42));
    expectNumber(readXml("<integer>007</integer>"), Number(7));
    expectNumber(readXml("<integer>9223372036854775807</integer>"), Number(most));
    expectNumber(readXml("<integer>9223372036854775808</integer>"), Number(std::uint64_t{1} << 63));
    expectNumber(readXml("<integer>18446744073709551615</integer>"), Number(mostUnsigned));
    expectNumber(readXml("<integer>-9223372036854775808</integer>"), Number(least));
    expectNumber(readXml("<integer>0x2104000c</integer>"), Number(0x2104000C));
    expectNumber(readXml("<integer>0XFFFFFFFFFFFFFFFF</integer>"), Number(mostUnsigned));
    expectNumber(readXml("<integer>-0x10</integer>"), Number(-16));
}

TEST(XmlPropertyList, Reals)
{
    expectNumber(readXml("<real>0.1</real>"), Number(0.1));
    expectNumber(readXml("<real> -1.5e3 </real>"), Number(-1500.0));
    expectNumber(readXml("<real>+7</real>"), Number(7.0));
    expectNumber(readXml("<real>4.9e-324</real>"), Number(std::numeric_limits<double>::denorm_min()));
    constexpr double infinity = std::numeric_limits<double>::infinity();
    expectNumber(readXml("<real>infinity</real>"), Number(infinity));
    expectNumber(readXml("<real>+inf</real>"), Number(infinity));
    expectNumber(readXml("<real>-Infinity</real>"), Number(-infinity));
    EXPECT_TRUE(std::isnan(readXml("<real>nan</real>").asDouble()));
}

TEST(XmlPropertyList, TruthValues)
{
    expectNumber(readXml("<true/>"), Number(true));
    expectNumber(readXml("<false></false>"), Number(false));
    expectNumber(readXml("<true> \n </true>"), Number(true));
}

TEST(XmlPropertyList, Dates)
{
    const auto date = [](std::string_view text) {
        const auto value = readXml("<date>" + std::string(text) + "</date>").date();
        return value ? value->secondsSince1970 : std::nan("");
    };
    EXPECT_EQ(date("1970-01-01T00:00:00Z"), 0);
    EXPECT_EQ(date("2001-01-01T00:00:00Z"), 978307200);
    EXPECT_EQ(date(" 2024-02-29T23:59:59Z\n"), 1709251199);
    EXPECT_EQ(date("0001-01-01T00:00:00Z"), -62135596800);
    EXPECT_EQ(date("9999-12-31T23:59:59Z"), 253402300799);
    // Missing last parts have their least value.
    EXPECT_EQ(date("2001-01-01T01:01Z"), 978307200 + 3660);
    EXPECT_EQ(date("2001-01-01T01Z"), 978307200 + 3600);
    EXPECT_EQ(date("2001-01-02Z"), 978307200 + 86400);
    EXPECT_EQ(date("2001-02Z"), 978307200 + 31 * 86400);
    EXPECT_EQ(date("2001Z"), 978307200);
}

TEST(XmlPropertyList, Data)
{
    const auto data = [](std::string_view text) {
        return std::string(readXml("<data>" + std::string(text) + "</data>").data().value_or(foundation::Data()).bytes);
    };
    EXPECT_EQ(data(""), "");
    EXPECT_EQ(data("YQ=="), "a");
    EXPECT_EQ(data("YWI="), "ab");
    EXPECT_EQ(data("YWJj"), "abc");
    EXPECT_EQ(data("\n\tYW\r\n\tJj Y Q = =\n"), "abca");
    EXPECT_EQ(data("+/+/"), "\xFB\xFF\xBF");
}

TEST(XmlPropertyList, TextIsKeptAsItStands)
{
    EXPECT_EQ(readXml("<string/>"), Value(""));
    EXPECT_EQ(readXml("<string>  a\tb \n </string>"), Value("  a\tb \n "));
    EXPECT_EQ(readXml("<string>   </string>"), Value("   "));
    EXPECT_EQ(readXml("<string>a\r\nb\rc</string>"), Value("a\nb\nc")) << "XML has one end of a line";
    EXPECT_EQ(readXml("<string>é€😀</string>"), Value("é€😀"));
    EXPECT_EQ(readXml("<dict><key> a&amp;b </key><true/></dict>"), Value(Dictionary{{" a&b ", true}}));
}

TEST(XmlPropertyList, ReferencesAreResolved)
{
    EXPECT_EQ(readXml("<string>&lt;&gt;&amp;&quot;&apos;</string>"), Value("<>&\"'"));
    EXPECT_EQ(readXml("<string>&#65;&#x42;&#x1F600;&#13;</string>"), Value("AB😀\r"));
    EXPECT_EQ(readXml("<string>&amp;amp; &amp;#65;</string>"), Value("&amp; &#65;")) << "once and not again";
    EXPECT_EQ(readXml("<integer>&#52;2</integer>"), Value(42));
}

TEST(XmlPropertyList, LiteralTextIsTakenAsItStands)
{
    EXPECT_EQ(readXml("<string>a<![CDATA[ <b> &amp; ]]>&amp;</string>"), Value("a <b> &amp; &"));
    EXPECT_EQ(readXml("<string><![CDATA[]]></string>"), Value(""));
}

TEST(XmlPropertyList, CommentsAndInstructionsSayNothing)
{
    EXPECT_EQ(readXml("<!-- <true/> --><array><?php x ?><string>a<!-- no -->b</string><!-- --></array>"),
              Value(Array{"ab"}));
}

TEST(XmlPropertyList, MayBeginWithAByteOrderMarkAndWithoutADeclaration)
{
    EXPECT_EQ(read("\xEF\xBB\xBF<plist><true/></plist>"), Value(true));
    EXPECT_EQ(read("\n <plist><true/></plist> \n"), Value(true));
}

TEST(XmlPropertyList, MayBeInUtf16OfEitherOrder)
{
    const std::string list = R"(<?xml version="1.0" encoding="UTF-16"?><plist><string>a&lt;é€😀</string></plist>)";
    for (const auto order : {std::endian::big, std::endian::little}) {
        EXPECT_EQ(read(utf16Bytes("\uFEFF" + list, order)), Value("a<é€😀"));
        EXPECT_EQ(read(utf16Bytes(list, order)), Value("a<é€😀")) << "without a byte order mark";
    }
}

TEST(XmlPropertyList, TheDocumentTypeIsNotLookedInto)
{
    EXPECT_EQ(read("<!DOCTYPE plist [<!ELEMENT plist ANY> <!-- > --> <!ENTITY a \"b\">]><plist><true/></plist>"),
              Value(true));
}

// --- binary

TEST(BinaryPropertyListObjects, TruthValuesAndNothing)
{
    expectNumber(readObject("08"), Number(false));
    expectNumber(readObject("09"), Number(true));
    EXPECT_TRUE(readObject("00").isNull());
}

TEST(BinaryPropertyListObjects, IntegersOfEveryWidth)
{
    expectNumber(readObject("1000"), Number(0));
    expectNumber(readObject("10ff"), Number(255)); // integers below 64 bits have no sign
    expectNumber(readObject("11ffff"), Number(65535));
    expectNumber(readObject("12ffffffff"), Number(4294967295));
    expectNumber(readObject("13ffffffffffffffff"), Number(-1));
    expectNumber(readObject("138000000000000000"), Number(least));
    expectNumber(readObject("137fffffffffffffff"), Number(most));
    expectNumber(readObject("1400000000000000007fffffffffffffff"), Number(most));
    expectNumber(readObject("1400000000000000008000000000000000"), Number(std::uint64_t{1} << 63));
    expectNumber(readObject("140000000000000000ffffffffffffffff"), Number(mostUnsigned));
    expectNumber(readObject("14ffffffffffffffffffffffffffffffff"), Number(-1));
}

TEST(BinaryPropertyListObjects, RealsOfBothWidths)
{
    expectNumber(readObject("223f19999a"), Number(0.6F));
    expectNumber(readObject("233fb999999999999a"), Number(0.1));
    expectNumber(readObject("237ff0000000000000"), Number(std::numeric_limits<double>::infinity()));
}

TEST(BinaryPropertyListObjects, DatesCountFrom2001)
{
    EXPECT_EQ(readObject("330000000000000000"), Value(Date{978307200}));
    EXPECT_EQ(readObject("33c1cd27e440000000"), Value(Date{0}));
    EXPECT_EQ(readObject("333fe0000000000000"), Value(Date{978307200.5}));
}

TEST(BinaryPropertyListObjects, DataAndText)
{
    EXPECT_EQ(readObject("40"), Value(Data()));
    EXPECT_EQ(readObject("4300ff61"),
              Value(Data{String(std::string_view("\0\xFF"
                                                 "a",
                                                 3))}));
    EXPECT_EQ(readObject("50"), Value(""));
    EXPECT_EQ(readObject("52610a"), Value("a\n"));
    EXPECT_EQ(readObject("6600e9006120ac00fcd83dde00"), Value("éa€ü😀")) << "in pairs where 16 bits are too few";
    EXPECT_EQ(readObject("520061"), Value(std::string_view("\0a", 2)));
}

TEST(BinaryPropertyListObjects, LengthsOfEveryWidth)
{
    const Value text(std::string(20, 'x'));
    for (const std::string_view length : {"1014", "110014", "1200000014", "130000000000000014"})
        EXPECT_EQ(readObject("5f" + std::string(length) + toHex(std::string(20, 'x'))), text) << length;
}

TEST(BinaryPropertyListObjects, AUidIsTheDictionaryThatXmlWritesForIt)
{
    EXPECT_EQ(readObject("8005"), Value(Dictionary{{"CF$UID", 5}}));
    EXPECT_EQ(readObject("82010000"), Value(Dictionary{{"CF$UID", 65536}}));
    expectNumber(*readObject("87ffffffffffffffff").dictionary()->find("CF$UID"), Number(mostUnsigned));
    EXPECT_EQ(readXml("<dict><key>CF$UID</key><integer>5</integer></dict>"), readObject("8005"));
}

TEST(BinaryPropertyListObjects, OffsetsAndReferencesOfEveryWidth)
{
    for (std::size_t offsetSize = 1; offsetSize <= 8; ++offsetSize)
        for (std::size_t referenceSize = 1; referenceSize <= 8; ++referenceSize) {
            const std::string references = support::bigEndian(1, referenceSize) + support::bigEndian(0, referenceSize);
            const BinaryPropertyList list{.objects = {fromHex("09"), fromHex("08"), '\xA2' + references},
                                          .top = 2,
                                          .offsetSize = offsetSize,
                                          .referenceSize = referenceSize};
            EXPECT_EQ(read(list.bytes()), Value(Array{false, true})) << offsetSize << ' ' << referenceSize;
        }
}

TEST(BinaryPropertyListObjects, SharedObjectsStandWhereverTheyAreReferredTo)
{
    const BinaryPropertyList list{.objects = {fromHex("a3010102"), fromHex("a10202"), fromHex("5161")}};
    EXPECT_EQ(read(list.bytes()), Value(Array{Array{"a"}, Array{"a"}, "a"}));
}

} // namespace
} // namespace foundation
