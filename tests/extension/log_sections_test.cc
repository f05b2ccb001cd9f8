// Log sections: how numbers are drawn, and what closing one logs.
#include <gtest/gtest.h>

#include "tests/support/TestEnvironment.h"

namespace skein {
namespace {

TEST(LogSections, NumbersRiseAndSkipTheWrongParityForGood) {
  TestEnvironment env;
  // With the log off too: what is drawn does not depend on what is logged.
  env.log.setEnabled(LogType::Debug, false);
  constexpr auto debug = VLLogSectionLevel::Debug;
  constexpr auto info = VLLogSectionLevel::Info;
  std::vector<std::uint64_t> drawn;
  for (const auto level : {debug, debug, info, info, debug}) {
    drawn.push_back(env.logSections.create(level));
  }
  EXPECT_EQ(drawn, (std::vector<std::uint64_t>{1, 3, 4, 6, 7}));
  EXPECT_EQ(TestEnvironment().logSections.create(info), 2u);
}

TEST(LogSections, CloseOnceAtTheirOwnLevel) {
  TestEnvironment env;
  vlc_closeLogSection(env.log, 0);
  vlc_closeLogSection(env.log, 0xabce);
  vlc_closeLogSection(env.log, 0xabcdef);
  EXPECT_EQ(env.run(), (Lines{"[INFO] ┗abce ", "[DEBUG] ┗abcdef "}));

  {
    VLLogSection first(env.log, env.logSections);
    VLLogSection moved = std::move(first);
    VLLogSection closed(env.log, env.logSections, VLLogSectionLevel::Info);
    closed.close();
  }
  EXPECT_EQ(env.run(), (Lines{"[INFO] ┗2 ", "[DEBUG] ┗1 "}));

  env.log.setEnabled(LogType::Debug, false);
  vlc_closeLogSection(env.log, 5);
  EXPECT_EQ(env.run(), Lines{});
  vlc_closeLogSection(env.log, 6);
  EXPECT_EQ(env.run(), Lines{"[INFO] ┗6 "});
}

}  // namespace
}  // namespace skein
