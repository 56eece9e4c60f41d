// Property lists made to hurt: each ends within 100 ms of CPU and 16 MiB of memory, whatever it claims.
#include <gtest/gtest.h>

#include <ctime>
#include <fstream>

#include "binary_list_builder.h"
#include "formats/property_list.h"

#if defined(__has_feature)
#if __has_feature(address_sanitizer) || __has_feature(thread_sanitizer)
#define VELTRA_SANITIZED
#endif
#endif

namespace veltrad {
namespace {

using test::bigEndian;
using test::binaryList;
using test::container;
using Kind = PropertyListError::Kind;

// 100 ms are promised of what is shipped; code without optimisation takes four times as long, sanitizers
// more.
#if defined(VELTRA_SANITIZED)
constexpr double kMostSeconds = 1.0;
constexpr bool kMeasuresMemory = false;  // what they keep for themselves counts there
#elif defined(__OPTIMIZE__)
constexpr double kMostSeconds = 0.1;
constexpr bool kMeasuresMemory = true;
#else
constexpr double kMostSeconds = 0.4;
constexpr bool kMeasuresMemory = true;
#endif

double cpuSeconds() {
  timespec now{};
  clock_gettime(CLOCK_THREAD_CPUTIME_ID, &now);
  return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) / 1e9;
}

std::string repeated(const std::string& text, std::size_t times) {
  std::string all;
  for (std::size_t i = 0; i < times; ++i) all += text;
  return all;
}

// Every level holds the next one `width` times: width^levels objects.
std::string laughs(unsigned type, std::size_t levels, std::size_t width, const std::string& innermost) {
  std::vector<std::string> objects;
  for (std::size_t level = 0; level < levels; ++level) {
    std::vector<std::uint64_t> references(width, level + 1);
    if (type == 0xD0) references.insert(references.begin(), width, levels + 1);
    objects.push_back(container(type, width, references));
  }
  objects.push_back(innermost);
  objects.push_back("\x51k");
  return binaryList(objects);
}

std::string nested(std::size_t levels) {
  std::vector<std::string> objects;
  for (std::size_t level = 0; level < levels; ++level) objects.push_back(container(0xA0, 1, {level + 1}));
  objects.push_back("\x09");
  return binaryList(objects);
}

// As many references to one object as the limits allow, and as memory-hungry an object as there is.
std::string shared(const std::string& object, std::size_t times) {
  return binaryList({container(0xA0, times, std::vector<std::uint64_t>(times, 1)), object});
}

struct Hostile {
  const char* name;
  std::string bytes;
  std::optional<Kind> kind;  // none: a heavy list that is allowed
};

std::vector<Hostile> hostileLists() {
  const std::string plist = "<plist version=\"1.0\">";
  std::string manyAttributes = "<plist";
  for (int i = 0; manyAttributes.size() < 1'000'000; ++i)
    manyAttributes += " a" + std::to_string(i) + "=\"\"";
  return {
      {"arrays laugh", laughs(0xA0, 30, 1000, "\x09"), Kind::tooLarge},
      {"dictionaries laugh", laughs(0xD0, 30, 10, "\x09"), Kind::tooLarge},
      {"a text doubles", laughs(0xA0, 20, 2, "\x5F\x12" + bigEndian(500'000, 4) + std::string(500'000, 'x')),
       Kind::tooLarge},
      {"shared data", shared("\x4F\x10\x58" + std::string(0x58, 'x'), 65'535), {}},
      {"a shared array", shared("\xA0", 65'535), {}},
      {"shared long characters",
       shared("\x6F\x12" + bigEndian(200'000, 4) + repeated("\x26\x03", 200'000), 65'535), Kind::tooLarge},
      {"a cycle at the end",
       binaryList({container(0xA0, 60'000, std::vector<std::uint64_t>(60'000, 1)), container(0xA0, 1, {0})}),
       Kind::cyclic},
      {"deep arrays", nested(60'000), Kind::tooDeep},
      {"a huge count", binaryList({container(0xD0, 1ull << 40, {1, 1})}), Kind::malformed},
      {"deep XML", plist + repeated("<array>", 100'000), Kind::tooDeep},
      {"entities",
       "<!DOCTYPE plist [<!ENTITY a \"ha\"><!ENTITY b \"&a;&a;\">]>" + plist + "<string>&b;</string></plist>",
       Kind::forbidden},
      {"attributes", manyAttributes + "><true/></plist>", Kind::tooLarge},
      {"elements", plist + "<array>" + repeated("<true/>", 100'000) + "</array></plist>", Kind::tooLarge},
      {"dictionaries",
       plist + "<array>" + repeated("<dict><key>k</key><data>AAAA</data></dict>", 20'000) +
           "</array></plist>",
       {}},
      {"lines", plist + "<string>" + repeated("&lt;\n", 200'000) + "</string></plist>", {}},
      {"a long doctype", "<!DOCTYPE " + std::string(1'000'000, 'a') + ">", Kind::malformed},
      {"a long comment", "<!--" + std::string(1'000'000, '-'), Kind::malformed}};
}

// The most that the process ever had mapped, touched or not.
long mostKilobytes() {
  std::ifstream status("/proc/self/status");
  std::string line;
  while (std::getline(status, line) && !line.starts_with("VmPeak:")) {
  }
  return std::strtol(line.substr(7).c_str(), nullptr, 10);
}

TEST(HostilePropertyList, endsInTimeAndMemory) {
  const auto lists = hostileLists();
  const long before = mostKilobytes();
  for (const auto& [name, bytes, kind] : lists) {
    SCOPED_TRACE(name);
    ASSERT_LT(bytes.size(), 1u << 20);
    const double start = cpuSeconds();
    const auto read = formats::parsePropertyList(bytes);
    EXPECT_LT(cpuSeconds() - start, kMostSeconds);
    EXPECT_TRUE(mostKilobytes() - before < (16 << 10) || !kMeasuresMemory) << mostKilobytes() - before;
    if (kind) {
      ASSERT_FALSE(read.ok());
      EXPECT_EQ(read.error().kind, *kind) << read.error().detail;
    } else {
      EXPECT_TRUE(read.ok()) << read.error().detail;
    }
  }
}

}  // namespace
}  // namespace veltrad
