// SPDX-License-Identifier: Apache-2.0
// Binary property lists: every object type, what is written, what is refused.
#include <gtest/gtest.h>

#include <numeric>
#include <sstream>

#include "binary_list_builder.h"
#include "formats/json.h"
#include "formats/property_list.h"

namespace veltrad {
namespace {

using namespace std::literals;
using test::ascii;
using test::bigEndian;
using test::binaryList;
using test::container;
using Kind = PropertyListError::Kind;

TEST(BinaryPropertyList, readsEveryType) {
  std::istringstream hex(
      "08 09 10FF 11FFFE 12FFFFFFFF 13FFFFFFFFFFFFFFFE 140000000000000000FFFFFFFFFFFFFFFF "
      "14FFFFFFFFFFFFFFFFFFFFFFFFFFFFFFFF 223FC00000 23BFF8000000000000 330000000000000000 4200FF 53616263 "
      "5F100F616161616161616161616161616161 6200E92603 62D83DDE00 62D83D0041 61DE00 810102 A0 C0 D0");
  std::vector<std::string> objects{""};
  for (std::string digits; hex >> digits; objects.push_back({}))
    for (std::size_t i = 0; i < digits.size(); i += 2)
      objects.back() += static_cast<char>(std::stoi(digits.substr(i, 2), nullptr, 16));
  std::vector<std::uint64_t> references(objects.size() - 1);
  std::iota(references.begin(), references.end(), 0);
  objects.back() = container(0xA0, references.size(), references);
  const auto bytes = binaryList(objects, [&](test::Trailer& trailer) { trailer.top = references.size(); });
  const auto all = formats::parsePropertyList(bytes);
  ASSERT_TRUE(all.ok()) << all.error().detail;
  EXPECT_EQ(formats::writeJSON(all.value()),
            R"([false,true,255,65534,4294967295,-2,18446744073709551615,-1,1.5,-1.5,{"$date":978307200.0},)"
            R"({"$data":"AP8="},"abc","aaaaaaaaaaaaaaa","é☃",)"
            "\"\U0001F600\",\"\uFFFDA\",\"\uFFFD\",258,[],[],{}]");
  // A null entry is left out, a repeated key counts by its last value, a set is an array.
  const auto read = formats::parsePropertyList(binaryList(
      {"\xD4" + bigEndian(0x0001'0002'0001'0003, 8) + bigEndian(0x0004'0005'0006'0007, 8), ascii("a"),
       ascii("n"), ascii("s"), "\x10\x01", "\0"s, "\x10\x02", "\xC2\x00\x01\x00\x06"s}));
  ASSERT_TRUE(read.ok()) << read.error().detail;
  EXPECT_TRUE(read.value() == Value(Dictionary{{"a", 2}, {"s", Array{"a", 2}}}));
}

TEST(BinaryPropertyList, writesTheseBytes) {
  const std::string trailer = std::string(6, '\0') + "\x01\x01" + bigEndian(3, 8) + bigEndian(0, 8);
  EXPECT_EQ(writeBinaryPropertyList(Dictionary{{"k", "\u00e9"}}),
            "bplist00\xD1\x01\x02\x51k\x61\x00\xE9"s + "\x08\x0B\x0D" + trailer + bigEndian(16, 8));
  const auto mended = formats::parsePropertyList(writeBinaryPropertyList("a\xC3(\xED\xA0\x80"));
  ASSERT_TRUE(mended.ok());
  EXPECT_TRUE(mended.value() == Value("a\uFFFD(\uFFFD\uFFFD\uFFFD"));
}

void expectRefusal(const std::string& bytes, Kind kind) {
  const auto read = formats::parsePropertyList(bytes);
  ASSERT_FALSE(read.ok()) << testing::PrintToString(bytes);
  EXPECT_EQ(read.error().kind, kind) << testing::PrintToString(bytes) << ": " << read.error().detail;
  EXPECT_FALSE(read.error().detail.empty()) << testing::PrintToString(bytes);
}

TEST(BinaryPropertyList, refusesBrokenTrailers) {
  using test::Trailer;
  const std::string sound = binaryList({"\x09"});
  expectRefusal("bplist01" + sound.substr(8), Kind::notAPropertyList);
  expectRefusal("bplist00", Kind::malformed);
  expectRefusal(sound.substr(0, 40), Kind::malformed);
  const auto refuses = [](std::uint64_t Trailer::*field, std::vector<std::uint64_t> numbers) {
    for (const auto number : numbers)
      expectRefusal(binaryList({"\x09"}, [&](Trailer& t) { t.*field = number; }), Kind::malformed);
  };
  refuses(&Trailer::offsetSize, {0, 9});
  refuses(&Trailer::referenceSize, {0});
  refuses(&Trailer::count, {0, 2, (1ull << 62) + 1});  // the last with a product that wraps
  refuses(&Trailer::top, {1});
  refuses(&Trailer::table, {8, 14, ~0ull});
  // An offset that points into the table.
  expectRefusal(binaryList({"\x09"}, [](Trailer& t) { t.offsetSize = 1, t.table = 9; }), Kind::malformed);
}

TEST(BinaryPropertyList, refusesBrokenObjects) {
  const std::string null(1, '\0');
  for (const std::string& object :
       {// references and counts beyond what is there, or that wrap
        container(0xA0, 1, {1}), container(0xA0, 9, {0}), container(0xD0, 1ull << 63, {0, 0}),
        "\x5F\x13" + bigEndian(~0ull, 8) + "abc", "\x6F\x13" + bigEndian(1ull << 63, 8) + "ab", "\x5F"s,
        // a count that is no integer; integers, a real and an identifier of sizes that there are not
        "\x5F\x22" + ascii("cd"), "\x15" + std::string(32, '\0'), "\x14" + bigEndian(1, 8) + bigEndian(0, 8),
        "\x21\x01\x02"s, "\x88" + bigEndian(0, 9),
        // ASCII that is none, an unknown type, null on top
        "\x51\x80"s, "\xF0"s, null})
    expectRefusal(binaryList({object}), Kind::malformed);
  expectRefusal(binaryList({container(0xA0, 1, {1}), null}), Kind::malformed);
  expectRefusal(binaryList({container(0xD0, 1, {1, 2}), null, "\x09"}), Kind::malformed);
  expectRefusal(binaryList({container(0xD0, 1, {1, 1}), "\x10\x01"}), Kind::malformed);
  expectRefusal(binaryList({container(0xA0, 1, {0})}), Kind::cyclic);
  expectRefusal(binaryList({container(0xA0, 1, {1}), container(0xC0, 1, {0})}), Kind::cyclic);
}

TEST(PropertyListLimits, holdExactlyInBothForms) {
  const Value value = Dictionary{{"abc", Array{Data{"12"}, "\u00e9"}}};
  for (const std::string& bytes : {writeBinaryPropertyList(value), formats::writeXMLPropertyList(value)}) {
    const PropertyListLimits fits{.bytes = bytes.size(), .depth = 2, .objects = 5, .textBytes = 7};
    EXPECT_TRUE(formats::parsePropertyList(bytes, fits).ok());
    for (int limit = 0; limit < 4; ++limit) {
      PropertyListLimits less = fits;
      less.bytes -= limit == 0, less.objects -= limit == 1, less.textBytes -= limit == 2,
          less.depth -= limit == 3;
      const auto read = formats::parsePropertyList(bytes, less);
      ASSERT_FALSE(read.ok()) << limit;
      EXPECT_EQ(read.error().kind, limit == 3 ? Kind::tooDeep : Kind::tooLarge) << limit;
    }
  }
}

}  // namespace
}  // namespace veltrad
