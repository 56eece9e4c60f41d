// The tables of client types and environments at their edges and where types share an entry.
#include "config/client_types.h"

#include <gtest/gtest.h>

#include <climits>
#include <string>

namespace veltrad {
namespace {

std::string orNone(const char* text) {
  return text != nullptr ? text : "(none)";
}

TEST(ClientTypes, HaveStorebagsFromFiveToSeventeen) {
  std::string all;
  for (std::int32_t type = -1; type <= kVeltraClientTypeCount; ++type)
    all += orNone(storebagNameForClientType(type)) + ' ';
  EXPECT_EQ(all,
            "(none) (none) (none) (none) (none) (none) pellmarch ostvane quindle brevatto sollwick tamberlin "
            "quindle "
            "crovish quindle ostvane ostvane melkard yarrowin (none) ");
  EXPECT_EQ(storebagNameForClientType(INT_MIN), nullptr);
  EXPECT_EQ(storebagNameForClientType(INT_MAX), nullptr);
}

TEST(ClientTypes, HaveASenderCodeEach) {
  std::string all;
  for (std::int32_t type = -1; type <= kVeltraClientTypeCount; ++type)
    all += orNone(senderCodeForComponentType(type)) + ' ';
  EXPECT_EQ(all,
            "(none) PV DR XLN BQ HW ZE FU JY KO WA UT EB MYRT QOLIN FU-GLP FU-TOLMS GARNOVE LIMBET (none) ");
}

TEST(Environments, NameTheirSections) {
  std::string all;
  for (std::uint32_t environment = 0; environment <= 5; ++environment)
    all += orNone(sectionNameForEnvironment(environment)) + ' ';
  EXPECT_EQ(all, "(none) development florn_internal seed release (none) ");
  EXPECT_EQ(sectionNameForEnvironment(UINT_MAX), nullptr);
}

}  // namespace
}  // namespace veltrad
