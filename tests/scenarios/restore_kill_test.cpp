// Processes that die in the middle of a restore, at one step after another. Whatever the step, a
// second restore ends with what an undisturbed one ends with.

#include "tests/scenarios/restore_phone.h"
#include "tests/test_pch.h"

namespace appsync::host {
namespace {

using namespace testing;
using Demotion = SampleBackup::Demotion;

// A sanitizer's process dies ten times as slowly, and is there for what the threads do meanwhile.
#if defined(__SANITIZE_THREAD__) || defined(__SANITIZE_ADDRESS__)
constexpr int StepsBetweenDeaths = 9;
#else
constexpr int StepsBetweenDeaths = 1;
#endif

struct Way {
  const char* name;
  bool coordination = false;
  bool store = false;
  bool packages = false;
};

class RestoreKillTest : public ::testing::TestWithParam<Way> {
 protected:
  RestoreInput input() {
    backup_.add("com.a", "notes of a");
    backup_.add("com.b", "notes of b", Demotion::Intentional);
    backup_.add("com.c");
    for (const char* identifier : {"com.a", "com.b", "com.c"}) shelf_.add(identifier);
    RestoreInput input = backup_.read();
    if (GetParam().store) input.catalogue = shelf_.library();
    if (GetParam().packages) input.packages = shelf_.library();
    return input;
  }
  static std::vector<std::string> undisturbed(const RestoreInput& all) {
    RestoringPhone phone(GetParam().coordination);
    phone.restore(all);
    return phone.picture();
  }

 private:
  SampleBackup backup_;
  Shelf shelf_;
};

TEST_P(RestoreKillTest, SecondRestoreFinishes) {
  const RestoreInput all = input();
  const std::vector<std::string> expected = undisturbed(all);
  bool died = true;
  for (int step = 0; died && !HasFailure(); step += StepsBetweenDeaths) {
    RestoringPhone phone(GetParam().coordination);
    died = phone.restoreAndDie(all, step);
    phone.restore(all);
    EXPECT_EQ(phone.picture(), expected) << "after step " << step;
    EXPECT_FALSE(phone.device().files().fileExists(exchange::RestoreList));
    if (!died) {
      EXPECT_GT(step, 30);
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Ways, RestoreKillTest,
                         ::testing::Values(Way{"Plain"}, Way{"PlainWithStore", false, true},
                                           Way{"PlainWithPackages", false, false, true},
                                           Way{"Coordinated", true},
                                           Way{"CoordinatedWithStore", true, true}),
                         [](const auto& instance) { return instance.param.name; });

}  // namespace
}  // namespace appsync::host
