// SPDX-License-Identifier: Apache-2.0
// All errors of property lists and their texts; none of them costs more than it may.
#include "foundation/plist/PropertyList.h"

#include "foundation/LargestAllocation.h"
#include "foundation/cbor/Hex.h"
#include "foundation/plist/PropertyListWriter.h"
#include "foundation/values/GeneratedValues.h"

#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>
#include <string>
#include <string_view>

namespace foundation {
namespace {

using support::bigEndian;
using support::binaryHead;
using support::BinaryPropertyList;
using support::binaryPropertyList;
using support::utf16Bytes;
using support::xmlDocument;
using support::xmlPropertyList;
using enum PropertyListError;

void expectFailure(std::string_view bytes, PropertyListError error, std::string_view text,
                   const PropertyListLimits& limits = {})
{
    const auto read = readPropertyList(bytes, limits);
    ASSERT_FALSE(read) << bytes << " is " << read->text();
    EXPECT_EQ(read.error().error, error) << bytes << ": " << read.error().text;
    EXPECT_EQ(read.error().text, text) << bytes;
}

// The errors in elements on line 4.
void expectXmlFailure(std::string_view elements, PropertyListError error, const std::string& text)
{
    expectFailure(xmlDocument(elements), error, "line 4: " + text);
}

// The errors in one object.
void expectObjectFailure(std::string_view hex, PropertyListError error, const std::string& text)
{
    expectFailure(BinaryPropertyList{.objects = {fromHex(hex)}}.bytes(), error, "object 0 at byte 8: " + text);
}

std::string repeated(std::string_view piece, std::size_t count)
{
    std::string all;
    for (std::size_t index = 0; index < count; ++index)
        all += piece;
    return all;
}

// --- neither form

TEST(PropertyListErrors, NoBytes)
{
    expectFailure("", Malformed, "the file is empty");
}

TEST(PropertyListErrors, TooManyBytesAreNotLookedAt)
{
    expectFailure(std::string((1 << 20) + 1, 'x'), TooLarge, "more than 1048576 bytes");
    const std::string list = xmlDocument("<true/>");
    EXPECT_TRUE(readPropertyList(list, {.bytes = list.size()}));
    expectFailure(list, TooLarge, "more than 10 bytes", {.bytes = 10});
}

TEST(PropertyListErrors, NeitherForm)
{
    expectFailure("Children", Malformed, "line 1: text where only elements can stand");
    expectFailure("{ Children = (); }", Malformed, "line 1: text where only elements can stand");
    expectFailure(std::string(4, '\0'), InvalidText, "the file is not text in UTF-8 or UTF-16");
    expectFailure("bplis", Malformed, "line 1: text where only elements can stand");
    expectFailure("bplist10" + std::string(40, '\0'), Unsupported, "header: a binary property list of another version");
}

// --- XML

TEST(XmlPropertyListErrors, NotWellFormed)
{
    // Only the first of many failures is searched from the beginning.
    expectXmlFailure("<string>" + repeated("<a/>", 100'000) + "</string>", Malformed,
                     "an element where only text can stand");
    expectXmlFailure("<dict></array>", Malformed, "not well-formed XML: Start-end tags mismatch");
    for (const std::string_view document :
         {"<plist><true/>", "<plist><true></plist>", "<plist><array></true></plist>", "<", "<plist", "<plist>&",
          "<plist><true /</plist>", "<plist><string><![CDATA[x</string></plist>", "<plist><!-- x</plist>",
          "<!DOCTYPE plist [<!ENTITY a \"b\">", "<plist a=b><true/></plist>"}) {
        const auto read = readPropertyList(document);
        ASSERT_FALSE(read) << document;
        EXPECT_EQ(read.error().error, Malformed) << document;
    }
}

TEST(XmlPropertyListErrors, TheLineIsTheOneWhereItGoesWrong)
{
    expectFailure("<plist>\n<dict>\n<key>a</key>\n<integer>x</integer>\n</dict>\n</plist>", InvalidValue,
                  "line 4: not an integer of 64 bits");
    expectFailure("<plist>\n<dict>\n</array>", Malformed, "line 3: not well-formed XML: Start-end tags mismatch");
}

TEST(XmlPropertyListErrors, NoPropertyList)
{
    expectFailure("<dict/>", Malformed, "line 1: the document is not a property list");
    expectFailure("<!-- nothing -->", Malformed, "line 1: an element is missing");
    expectFailure("<plist/>", Malformed, "line 1: an element is missing");
    expectFailure("<plist><true/><true/></plist>", Malformed, "line 1: a second element where only one can stand");
    expectFailure("<plist><true/></plist>\n<plist><true/></plist>", Malformed,
                  "line 2: a second element where only one can stand");
    expectFailure("<plist>x<true/></plist>", Malformed, "line 1: text where only elements can stand");
    expectFailure("<plist><true/></plist>\nx", Malformed, "line 2: text where only elements can stand");
}

TEST(XmlPropertyListErrors, UnknownElements)
{
    for (const std::string_view element : {"<set/>", "<Dict/>", "<plist><true/></plist>", "<key>a</key>", "<null/>"})
        expectXmlFailure(element, Unsupported, "an element that property lists do not have there");
}

TEST(XmlPropertyListErrors, KeysAndValuesDoNotAlternate)
{
    expectXmlFailure("<dict><true/></dict>", Malformed, "a value without a key");
    expectXmlFailure("<dict><key>a</key><true/><true/></dict>", Malformed, "a value without a key");
    expectXmlFailure("<dict><key>a</key><key>b</key><true/></dict>", Malformed, "the key before has no value");
    expectXmlFailure("<dict><key>a</key><true/><key>b</key></dict>", Malformed,
                     "the last key of the dictionary has no value");
    expectXmlFailure("<dict>a<key>a</key><true/></dict>", Malformed, "text where only elements can stand");
    expectXmlFailure("<array><![CDATA[a]]></array>", Malformed, "text where only elements can stand");
}

TEST(XmlPropertyListErrors, ElementsInsideOfText)
{
    for (const std::string_view element :
         {"<string>a<b/></string>", "<integer><true/></integer>", "<dict><key><key/></key><true/></dict>",
          "<true><true/></true>", "<data><string/></data>"})
        expectXmlFailure(element, Malformed, "an element where only text can stand");
}

TEST(XmlPropertyListErrors, NotUtf16)
{
    const auto expectNoText = [](std::string_view bytes) {
        expectFailure(bytes, InvalidText, "the file is not text in UTF-8 or UTF-16");
    };
    for (const auto order : {std::endian::big, std::endian::little}) {
        const std::string list = utf16Bytes("<plist><true/></plist>", order);
        EXPECT_TRUE(readPropertyList(list));
        expectNoText(list + '>'); // half a unit
        expectNoText(list + utf16Bytes("a", order).insert(0, 2, '\xD8')); // half a character
        expectNoText(list + std::string(2, '\0'));
        expectNoText(utf16Bytes(" <plist><true/></plist>", order)); // no mark, and no sign of its order
    }
    expectNoText(std::string_view("\xFF\xFE\0\0<\0\0\0", 8)); // UTF-32
}

TEST(XmlPropertyListErrors, TheLineIsReportedInUtf16AsWell)
{
    const std::string list = "<plist>\n<dict>\n<key>a</key>\n<integer>x</integer>\n</dict>\n</plist>";
    expectFailure(utf16Bytes("\uFEFF" + list, std::endian::little), InvalidValue, "line 4: not an integer of 64 bits");
}

TEST(XmlPropertyListErrors, NotUtf8)
{
    expectFailure(xmlDocument("<string>\xFF</string>"), InvalidText, "the file is not text in UTF-8 or UTF-16");
    expectFailure(xmlDocument("<string>\xED\xA0\x80</string>"), InvalidText, "the file is not text in UTF-8 or UTF-16");
    expectFailure(xmlDocument(std::string_view("<string>a\0b</string>", 20)), InvalidText,
                  "the file is not text in UTF-8 or UTF-16");
    expectFailure(xmlDocument("<true/>") + '\0', InvalidText, "the file is not text in UTF-8 or UTF-16");
}

TEST(XmlPropertyListErrors, ReferencesToNoCharacter)
{
    for (const std::string_view reference : {"&nbsp;", "&a;",      "&",        "&;",         "&amp",
                                             "&AMP;",  "& amp;",   "&#;",      "&#x;",       "&#0;",
                                             "&#x0;",  "&#-1;",    "&#+1;",    "&#65",       "&#6 5;",
                                             "&#X41;", "&#xD800;", "&#xDFFF;", "&#x110000;", "&#99999999999999999999;",
                                             "&#65a;"}) {
        expectXmlFailure("<string>a" + std::string(reference) + "</string>", InvalidText,
                         "a reference that is not to a character");
        expectXmlFailure("<dict><key>" + std::string(reference) + "</key><true/></dict>", InvalidText,
                         "a reference that is not to a character");
    }
}

TEST(XmlPropertyListErrors, EntitiesThatTheDocumentDefinesAreRefused)
{
    expectFailure("<!DOCTYPE plist [<!ENTITY a \"b\">]><plist><string>&a;</string></plist>", InvalidText,
                  "line 1: a reference that is not to a character");
    expectFailure("<!DOCTYPE plist [<!ENTITY a SYSTEM \"file:///etc/passwd\">]><plist><string>&a;</string></plist>",
                  InvalidText, "line 1: a reference that is not to a character");
    expectFailure("<!DOCTYPE plist [<!ENTITY % a SYSTEM \"http://dtd.invalid/a\"> %a;]><plist>&a;</plist>", Malformed,
                  "line 1: text where only elements can stand");
}

TEST(XmlPropertyListErrors, Integers)
{
    for (const std::string_view text : {"", " ", "x", "1x", "1 2", "1.0", "1e3", "--1", "+-1", "0x", "0xg", "-", "+",
                                        "18446744073709551616", "-9223372036854775809", "0x10000000000000000"})
        expectXmlFailure("<integer>" + std::string(text) + "</integer>", InvalidValue, "not an integer of 64 bits");
}

TEST(XmlPropertyListErrors, Reals)
{
    for (const std::string_view text : {"", "x", "1,5", "1.5x", "0x1p3", "++1", "+-1", "1e400", "in", "."})
        expectXmlFailure("<real>" + std::string(text) + "</real>", InvalidValue,
                         "not a real number that 64 bits can hold");
}

TEST(XmlPropertyListErrors, Dates)
{
    for (const std::string_view text : {"",
                                        "Z",
                                        "2026",
                                        "2026-03-01",
                                        "2026-03-01T12:30:00",
                                        "2026-3-1Z",
                                        "26-03-01Z",
                                        "2026-13-01Z",
                                        "2026-00-01Z",
                                        "2026-02-29Z",
                                        "2026-03-00Z",
                                        "2026-03-01T24:00:00Z",
                                        "2026-03-01T23:60:00Z",
                                        "2026-03-01T23:59:60Z",
                                        "2026-03-01 12:30:00Z",
                                        "2026-03-01T12:30:00.5Z",
                                        "2026-03-01T12:30:00+01:00Z",
                                        "2026-03-01T12:30:00:00Z",
                                        "2026-03-01T12:30:00-Z",
                                        "2026-Z",
                                        "+026-03-01Z",
                                        "-026-03-01Z",
                                        "2026-03-01T-1:00:00Z",
                                        "12026-03-01Z"})
        expectXmlFailure("<date>" + std::string(text) + "</date>", InvalidValue,
                         "not a date such as 2026-03-01T12:30:00Z");
}

TEST(XmlPropertyListErrors, Data)
{
    for (const std::string_view text :
         {"Y", "YQ", "YQ=", "YQ===", "Y===", "====", "=", "YQ==YQ==", "YQ=a", "Y_Q=", "YQ==\xC3\xA9"})
        expectXmlFailure("<data>" + std::string(text) + "</data>", InvalidValue, "data that is not in base64");
}

TEST(XmlPropertyListErrors, TruthValues)
{
    expectXmlFailure("<true>yes</true>", InvalidValue, "a truth value with text in it");
    expectXmlFailure("<false>0</false>", InvalidValue, "a truth value with text in it");
}

TEST(XmlPropertyListErrors, TooDeep)
{
    const auto nested = [](std::size_t depth) {
        return xmlDocument(repeated("<array>", depth) + repeated("</array>", depth));
    };
    EXPECT_TRUE(readPropertyList(nested(32)));
    expectFailure(nested(33), TooDeep, "line 4: more than 32 containers inside each other");
    expectFailure(nested(60'000), TooDeep, "line 4: more than 32 containers inside each other");
    expectFailure(xmlDocument("<dict><key>a</key><dict/></dict>"), TooDeep,
                  "line 4: more than 1 containers inside each other", {.depth = 1});
    EXPECT_TRUE(readPropertyList(xmlDocument("<true/>"), {.depth = 0}));
}

TEST(XmlPropertyListErrors, TooManyObjects)
{
    const std::string four = xmlDocument("<dict><key>a</key><array><true/></array></dict>");
    EXPECT_TRUE(readPropertyList(four, {.objects = 4}));
    expectFailure(four, TooManyObjects, "line 4: more than 3 objects", {.objects = 3});
    expectFailure(four, TooManyObjects, "line 4: more than 1 objects", {.objects = 1});
    expectFailure(xmlDocument("<array>" + repeated("<true/>", 70'000) + "</array>"), TooManyObjects,
                  "line 4: more than 65536 objects");
}

// --- binary

TEST(BinaryPropertyListErrors, Trailer)
{
    const BinaryPropertyList list{.objects = {"\x09"}};
    const std::string body = list.header + "\x09" + bigEndian(8, 4);
    ASSERT_TRUE(readPropertyList(body + list.trailer(1, 9)));

    expectFailure("bplist00", Malformed, "trailer: the file ends before it");
    expectFailure(std::string_view(list.bytes()).substr(0, 39), Malformed, "trailer: the file ends before it");
    for (const std::uint64_t table :
         {std::uint64_t{0}, std::uint64_t{7}, std::uint64_t{10}, std::uint64_t{100}, ~std::uint64_t{0}})
        expectFailure(body + list.trailer(1, table), Malformed,
                      "trailer: an offset table that does not lie within the file");
    expectFailure(body + list.trailer(2, 9), Malformed, "trailer: an offset table that does not lie within the file");
    for (const std::uint64_t count : {std::uint64_t{65537}, std::uint64_t{1} << 62, ~std::uint64_t{0}})
        expectFailure(body + list.trailer(count, 9), TooManyObjects, "trailer: more than 65536 objects");
    for (const std::size_t size : {0, 9, 255}) {
        BinaryPropertyList other = list;
        other.offsetSize = size;
        expectFailure(body + other.trailer(1, 9), Malformed,
                      "trailer: offsets or references of no or more than 8 bytes");
        other = list;
        other.referenceSize = size;
        expectFailure(body + other.trailer(1, 9), Malformed,
                      "trailer: offsets or references of no or more than 8 bytes");
    }
}

TEST(BinaryPropertyListErrors, NoSuchObject)
{
    expectFailure(BinaryPropertyList{.objects = {"\x09"}, .top = 1}.bytes(), Malformed,
                  "object 1: this object does not exist");
    expectFailure(BinaryPropertyList{.objects = {"\x09"}, .top = ~std::uint64_t{0}}.bytes(), Malformed,
                  "object 18446744073709551615: this object does not exist");
    expectFailure(BinaryPropertyList{}.bytes(), Malformed, "object 0: this object does not exist");
    expectFailure(BinaryPropertyList{.objects = {fromHex("a105")}}.bytes(), Malformed,
                  "object 5: this object does not exist");
}

TEST(BinaryPropertyListErrors, OffsetsOutsideOfTheObjects)
{
    const BinaryPropertyList list{.objects = {"\x09"}};
    for (const std::uint32_t offset : {0U, 7U, 9U, 12U, 1000U, ~0U})
        expectFailure(list.header + "\x09" + bigEndian(offset, 4) + list.trailer(1, 9), Malformed,
                      "object 0 at byte " + std::to_string(offset) + ": that is not a place of objects");
}

TEST(BinaryPropertyListErrors, ObjectsThatReachBeyondTheObjects)
{
    for (const std::string_view hex : {"10",
                                       "1100",
                                       "12000000",
                                       "13000000",
                                       "1400000000",
                                       "22000000",
                                       "23",
                                       "330000",
                                       "41",
                                       "5f",
                                       "4f",
                                       "4f10",
                                       "4f1002",
                                       "4f137fffffffffffffff",
                                       "4f13ffffffffffffffff",
                                       "5261",
                                       "5f137fffffffffffffff",
                                       "610",
                                       "6261",
                                       "62006100",
                                       "6f13ffffffffffffffff",
                                       "6f138000000000000000",
                                       "81",
                                       "8f00",
                                       "a1",
                                       "a200",
                                       "af13ffffffffffffffff",
                                       "af122000000000",
                                       "d1",
                                       "d100",
                                       "d2000000",
                                       "df13ffffffffffffffff",
                                       "df138000000000000000"})
        expectObjectFailure(hex, Malformed, "it reaches beyond the objects");
}

TEST(BinaryPropertyListErrors, LengthsThatAreNotIntegers)
{
    for (const std::string_view hex : {"4f00", "4f09", "4f4161", "5f5161", "6f2200000000", "af1400", "df80", "af0f"})
        expectObjectFailure(hex, Malformed, "its length is not an integer of at most 64 bits");
}

TEST(BinaryPropertyListErrors, KindsThatPropertyListsDoNotHave)
{
    for (const std::string_view hex : {"01", "07", "0a", "0f", "70", "7161", "90", "b0", "c0", "e0", "f0", "ff"})
        expectObjectFailure(hex, Unsupported, "a kind of object that property lists do not have");
}

TEST(BinaryPropertyListErrors, ValuesThatAreMalformed)
{
    expectObjectFailure("15" + std::string(64, '0'), InvalidValue, "an integer of more than 16 bytes");
    expectObjectFailure("1400000000000000010000000000000000", InvalidValue, "not an integer of 64 bits");
    expectObjectFailure("14ffffffffffffffff7fffffffffffffff", InvalidValue, "not an integer of 64 bits");
    expectObjectFailure("14fffffffffffffffe8000000000000000", InvalidValue, "not an integer of 64 bits");
    for (const std::string_view detail : {"20", "21", "24", "2f"})
        expectObjectFailure(std::string(detail) + "0000", InvalidValue, "a real number of neither 32 nor 64 bits");
    expectObjectFailure("337ff8000000000000", InvalidValue, "not a date");
    expectObjectFailure("33fff0000000000000", InvalidValue, "not a date");
    expectObjectFailure("320000000000000000", InvalidValue, "not a date");
    expectObjectFailure("88000000000000000000", InvalidValue, "a UID of more than 64 bits");
}

TEST(BinaryPropertyListErrors, TextThatIsNotInItsEncoding)
{
    expectObjectFailure("52c3a9", InvalidText, "a string that is not in ASCII");
    for (const std::string_view hex : {"61d83d", "61de00", "62de00d83d", "62d83d0061", "62d83dd83d"})
        expectObjectFailure(hex, InvalidText, "a string that is not in UTF-16");
}

TEST(BinaryPropertyListErrors, KeysThatAreNotStrings)
{
    for (const std::string_view key : {"09", "1001", "4161", "a0", "d0", "00", "8000"})
        expectFailure(BinaryPropertyList{.objects = {fromHex("d10101"), fromHex(key)}}.bytes(), Malformed,
                      "object 0 at byte 8: a key that is not a string");
}

TEST(BinaryPropertyListErrors, ContainersThatContainThemselves)
{
    expectFailure(BinaryPropertyList{.objects = {fromHex("a100")}}.bytes(), Cycle,
                  "object 0 at byte 8: a container that contains itself");
    expectFailure(BinaryPropertyList{.objects = {fromHex("a101"), fromHex("d10200"), fromHex("5161")}}.bytes(), Cycle,
                  "object 0 at byte 8: a container that contains itself");
    expectFailure(BinaryPropertyList{.objects = {fromHex("d10000")}}.bytes(), Cycle,
                  "object 0 at byte 8: a container that contains itself");
    expectFailure(BinaryPropertyList{.objects = {fromHex("a20101"), fromHex("a102"), fromHex("a101")}}.bytes(), Cycle,
                  "object 1 at byte 11: a container that contains itself");
}

TEST(BinaryPropertyListErrors, TooDeep)
{
    const auto nested = [](std::size_t depth) {
        BinaryPropertyList list;
        for (std::size_t index = 0; index + 1 < depth; ++index)
            list.objects.push_back("\xA1" + bigEndian(index + 1, 1));
        list.objects.push_back("\xA0");
        return list;
    };
    EXPECT_TRUE(readPropertyList(nested(32).bytes()));
    expectFailure(nested(33).bytes(), TooDeep, "object 32 at byte 72: more than 32 containers inside each other");
    BinaryPropertyList uid = nested(32);
    uid.objects.back() = fromHex("8000");
    EXPECT_TRUE(readPropertyList(uid.bytes())) << "a UID is a container";
    uid = nested(33);
    uid.objects.back() = fromHex("8000");
    expectFailure(uid.bytes(), TooDeep, "object 32 at byte 72: more than 32 containers inside each other");
}

TEST(BinaryPropertyListErrors, TooManyObjects)
{
    const std::string five = BinaryPropertyList{.objects = {fromHex("d20102"
                                                                    "0303"),
                                                            fromHex("5161"), fromHex("5162"), "\x09"}}
                                 .bytes();
    EXPECT_TRUE(readPropertyList(five, {.objects = 5})) << "a shared object counts twice";
    expectFailure(five, TooManyObjects, "object 0 at byte 8: more than 4 objects", {.objects = 4});
    expectFailure(five, TooManyObjects, "trailer: more than 3 objects", {.objects = 3});
    expectFailure(BinaryPropertyList{.objects = {fromHex("8000")}}.bytes(), TooManyObjects,
                  "object 0 at byte 8: more than 2 objects", {.objects = 2});
}

// Thirty arrays of two, each twice the next: a billion leaves in two hundred bytes.
TEST(BinaryPropertyListErrors, SharedObjectsDoNotExplode)
{
    BinaryPropertyList list;
    for (std::uint64_t index = 1; index <= 30; ++index)
        list.objects.push_back("\xA2" + bigEndian(index, 1) + bigEndian(index, 1));
    list.objects.push_back("\x09");
    const auto read = readPropertyList(list.bytes());
    ASSERT_FALSE(read);
    EXPECT_EQ(read.error().error, TooManyObjects);
}

// Half a megabyte of text, sixty thousand times.
TEST(BinaryPropertyListErrors, SharedTextDoesNotExplode)
{
    for (const unsigned type : {0x4U, 0x5U}) {
        BinaryPropertyList list;
        list.objects.push_back(binaryHead(0xA, 60'000) + repeated("\x01", 60'000));
        list.objects.push_back(binaryHead(type, 500'000) + std::string(500'000, 'x'));
        expectFailure(list.bytes(), TooLarge, "object 1 at byte 60018: more than 4194304 bytes of text and data");
    }
    BinaryPropertyList list{.objects = {fromHex("a20101"), fromHex("53616263")}};
    EXPECT_TRUE(readPropertyList(list.bytes(), {.content = 6}));
    expectFailure(list.bytes(), TooLarge, "object 1 at byte 11: more than 5 bytes of text and data", {.content = 5});
}

TEST(BinaryPropertyListErrors, AClaimOfLengthCostsNothing)
{
    for (const std::string_view hex : {"4f137fffffffffffffff", "5f12ffffffff", "6f127fffffff", "af127fffffff",
                                       "df127fffffff", "af13ffffffffffffffff"}) {
        const std::string hostile = BinaryPropertyList{.objects = {fromHex(hex)}}.bytes();
        forgetAllocations();
        const auto read = readPropertyList(hostile);
        EXPECT_LE(largestAllocation(), 4096U) << hex;
        EXPECT_FALSE(read);
    }
}

// --- any bytes

RC_GTEST_PROP(PropertyListErrorProperty, ReadingEndsForAllChanges, ())
{
    const Value value = *generated::value();
    std::string bytes = *rc::gen::arbitrary<bool>() ? binaryPropertyList(value) : xmlPropertyList(value);
    for (int changes = *rc::gen::inRange(1, 4); changes > 0; --changes)
        bytes[*rc::gen::inRange<std::size_t>(0, bytes.size())] = *rc::gen::arbitrary<char>();
    const auto read = readPropertyList(bytes);
    const bool saysWhy = !read.has_value() && !read.error().text.empty(); // the macro looks at both sides of an "or"
    RC_ASSERT(read.has_value() || saysWhy);
}

RC_GTEST_PROP(PropertyListErrorProperty, CutAtAnyByteADocumentIsRefused, ())
{
    const std::string document = xmlPropertyList(*generated::value(2));
    const std::size_t whole = document.rfind('>') + 1;
    for (std::size_t size = 0; size < whole; ++size)
        RC_ASSERT(!readPropertyList(std::string_view(document).substr(0, size)).has_value());
}

} // namespace
} // namespace foundation
