// Binary property lists: every object type, what is written, what is refused.
#include <gtest/gtest.h>

#include <cmath>

#include "base/property_list.h"
#include "binary_list_builder.h"

namespace veltrad {
namespace {

using namespace std::literals;
using test::bigEndian;
using test::binaryList;
using test::container;
using Kind = PropertyListError::Kind;

struct Object {
  std::string bytes;
  Value value;
};

TEST(BinaryPropertyList, readsEveryType) {
  const std::string long20(20, 'x');
  const Object kObjects[] = {
      {"\x08", false},
      {"\x09", true},
      {"\x10\xFF", 255},
      {"\x11\xFF\xFE", 65534},
      {"\x12\xFF\xFF\xFF\xFF", 4294967295u},
      {"\x13\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFE", -2},
      {"\x14" + bigEndian(0, 8) + bigEndian(~0ull, 8), ~0ull},
      {"\x14" + bigEndian(~0ull, 8) + bigEndian(~0ull, 8), -1},
      {"\x22\x3F\xC0\x00\x00"s, 1.5},
      {"\x23\xBF\xF8\x00\x00\x00\x00\x00\x00"s, -1.5},
      {"\x33" + std::string(8, '\0'), Date{978307200}},
      {"\x42\x00\xFF"s, Data{"\x00\xFF"s}},
      {"\x53"
       "abc",
       "abc"},
      {"\x5F\x10\x14" + long20, long20},
      {"\x62\x00\xE9\x26\x03"s, "\u00e9\u2603"},
      {"\x62\xD8\x3D\xDE\x00"s, "\U0001F600"},
      {"\x62\xD8\x3D\x00\x41"s,
       "\uFFFD"
       "A"},
      {"\x61\xDE\x00"s, "\uFFFD"},
      {"\x81\x01\x02", 258u},
      {"\xA0", Array{}},
      {"\xC0", Array{}},
      {"\xD0", Dictionary{}},
  };
  for (const auto& [bytes, value] : kObjects) {
    const auto read = parsePropertyList(binaryList({bytes}));
    ASSERT_TRUE(read.ok()) << read.error().detail;
    EXPECT_TRUE(read.value() == value) << testing::PrintToString(bytes);
  }
  // A null entry is left out, a repeated key counts by its last value, a set is an array.
  const auto read = parsePropertyList(binaryList({container(0xD0, 4, {1, 2, 1, 3, 4, 5, 6, 7}),
                                                  "\x51"
                                                  "a",
                                                  "\x51"
                                                  "n",
                                                  "\x51"
                                                  "s",
                                                  "\x10\x01",
                                                  {"\0", 1},
                                                  "\x10\x02",
                                                  container(0xC0, 2, {1, 6})}));
  ASSERT_TRUE(read.ok()) << read.error().detail;
  EXPECT_TRUE(read.value() == Value(Dictionary{{"a", 2}, {"s", Array{"a", 2}}}));
}

Value everything() {
  Array many;
  for (int i = 0; i < 300; ++i) many.push_back(i);  // more objects than one byte of reference reaches
  return Dictionary{
      {"ints",
       Array{0, 255, 256, 65535, 65536, 4294967295u, 4294967296, -1, INT64_MIN, INT64_MAX, UINT64_MAX}},
      {"reals", Array{0.0, -0.1, 1e300, HUGE_VAL}},
      {"texts",
       Array{"", "plain", std::string(15, 'a'), std::string(70'000, 'b'), "\u00e9", "\U0001F600", "a\0b"s}},
      {"data", Array{Data{""}, Data{std::string(300, '\xFF')}}},
      {"\u00fcber", Dictionary{{"date", Date{1.5e9}}, {"yes", true}, {"no", false}, {"none", Dictionary{}}}},
      {"many", many}};
}

TEST(BinaryPropertyList, writesWhatItReads) {
  const Value value = everything();
  const std::string bytes = writeBinaryPropertyList(value);
  const auto read = parsePropertyList(bytes);
  ASSERT_TRUE(read.ok()) << read.error().detail;
  EXPECT_TRUE(read.value() == value);

  std::string out = "header";
  appendBinaryPropertyList(value, out);
  EXPECT_EQ(out, "header" + bytes);
}

TEST(BinaryPropertyList, writesTheseBytes) {
  const std::string trailer = std::string(6, '\0') + "\x01\x01" + bigEndian(3, 8) + bigEndian(0, 8);
  EXPECT_EQ(writeBinaryPropertyList(Dictionary{{"k", "\u00e9"}}),
            "bplist00\xD1\x01\x02\x51k\x61\x00\xE9"s + "\x08\x0B\x0D" + trailer + bigEndian(16, 8));
  const auto mended = parsePropertyList(writeBinaryPropertyList("a\xC3(\xED\xA0\x80"));
  ASSERT_TRUE(mended.ok());
  EXPECT_TRUE(mended.value() == Value("a\uFFFD(\uFFFD\uFFFD\uFFFD"));
}

TEST(BinaryPropertyList, refusesBrokenLists) {
  const auto bent = [](auto change) { return binaryList({"\x09"}, change); };
  struct Case {
    const char* what;
    std::string bytes;
    Kind kind;
  } const kCases[] = {
      {"other version", "bplist01" + binaryList({"\x09"}).substr(8), Kind::notAPropertyList},
      {"header alone", "bplist00", Kind::malformed},
      {"trailer cut short", binaryList({"\x09"}).substr(0, 40), Kind::malformed},
      {"offsets of 0 bytes", bent([](auto& t) { t.offsetSize = 0; }), Kind::malformed},
      {"offsets of 9 bytes", bent([](auto& t) { t.offsetSize = 9; }), Kind::malformed},
      {"references of 0 bytes", bent([](auto& t) { t.referenceSize = 0; }), Kind::malformed},
      {"no objects", bent([](auto& t) { t.count = 0; }), Kind::malformed},
      {"more objects than offsets", bent([](auto& t) { t.count = 2; }), Kind::malformed},
      {"a product that wraps", bent([](auto& t) { t.count = (1ull << 62) + 1; }), Kind::malformed},
      {"top beyond the count", bent([](auto& t) { t.top = 1; }), Kind::malformed},
      {"table beyond the end", bent([](auto& t) { t.table = 14; }), Kind::malformed},
      {"table at a wrapping place", bent([](auto& t) { t.table = ~0ull; }), Kind::malformed},
      {"table in the header", bent([](auto& t) { t.table = 8; }), Kind::malformed},
      {"offset in the table", bent([](auto& t) { t.offsetSize = 1, t.table = 9; }), Kind::malformed},
      {"reference beyond the count", binaryList({container(0xA0, 1, {1})}), Kind::malformed},
      {"references beyond the objects", binaryList({container(0xA0, 9, {0})}), Kind::malformed},
      {"a count that wraps", binaryList({container(0xD0, 1ull << 63, {0, 0})}), Kind::malformed},
      {"text beyond the objects", binaryList({"\x5F\x13" + bigEndian(~0ull, 8) + "abc"}), Kind::malformed},
      {"UTF-16 count that wraps", binaryList({"\x6F\x13" + bigEndian(1ull << 63, 8) + "ab"}),
       Kind::malformed},
      {"count that is no integer",
       binaryList({"\x5F\x22"
                   "abcd"}),
       Kind::malformed},
      {"count at the end", binaryList({"\x5F"}), Kind::malformed},
      {"integer of 32 bytes", binaryList({"\x15" + std::string(32, '\0')}), Kind::malformed},
      {"integer beyond 64 bits", binaryList({"\x14" + bigEndian(1, 8) + bigEndian(0, 8)}), Kind::malformed},
      {"real of 2 bytes", binaryList({"\x21\x01\x02"}), Kind::malformed},
      {"identifier beyond 64 bits",
       binaryList({"\x88"
                   "123456789"}),
       Kind::malformed},
      {"ASCII that is none", binaryList({"\x51\x80"}), Kind::malformed},
      {"null on top", binaryList({{"\0", 1}}), Kind::malformed},
      {"null in an array", binaryList({container(0xA0, 1, {1}), {"\0", 1}}), Kind::malformed},
      {"null as a key", binaryList({container(0xD0, 1, {1, 2}), {"\0", 1}, "\x09"}), Kind::malformed},
      {"key that is a number", binaryList({container(0xD0, 1, {1, 1}), "\x10\x01"}), Kind::malformed},
      {"unknown type", binaryList({"\xF0"}), Kind::malformed},
      {"array in itself", binaryList({container(0xA0, 1, {0})}), Kind::cyclic},
      {"cycle of two", binaryList({container(0xA0, 1, {1}), container(0xC0, 1, {0})}), Kind::cyclic},
  };
  for (const Case& c : kCases) {
    const auto read = parsePropertyList(c.bytes);
    ASSERT_FALSE(read.ok()) << c.what;
    EXPECT_EQ(read.error().kind, c.kind) << c.what << ": " << read.error().detail;
    EXPECT_FALSE(read.error().detail.empty()) << c.what;
  }
}

TEST(BinaryPropertyList, holdsItsLimitsExactly) {
  const std::string bytes = writeBinaryPropertyList(Dictionary{{"abc", Array{Data{"12"}, "\u00e9"}}});
  const PropertyListLimits fits{.bytes = bytes.size(), .depth = 2, .objects = 5, .textBytes = 7};
  EXPECT_TRUE(parsePropertyList(bytes, fits).ok());
  const auto kindWith = [&](auto change) {
    PropertyListLimits limits = fits;
    change(limits);
    const auto read = parsePropertyList(bytes, limits);
    return read.ok() ? "read"s : std::to_string(static_cast<int>(read.error().kind));
  };
  const std::string tooLarge = std::to_string(static_cast<int>(Kind::tooLarge));
  EXPECT_EQ(kindWith([](auto& l) { --l.bytes; }), tooLarge);
  EXPECT_EQ(kindWith([](auto& l) { --l.objects; }), tooLarge);
  EXPECT_EQ(kindWith([](auto& l) { --l.textBytes; }), tooLarge);
  EXPECT_EQ(kindWith([](auto& l) { --l.depth; }), std::to_string(static_cast<int>(Kind::tooDeep)));
}

}  // namespace
}  // namespace veltrad
