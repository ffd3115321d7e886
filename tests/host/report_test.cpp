#include "host/report/report.h"

#include <sys/mman.h>
#include <unistd.h>

#include "host/report/json_line.h"
#include "host/report/report_text.h"
#include "tests/test_pch.h"

namespace appsync::host {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Not;

/// An output that keeps what is written.
class Memory {
 public:
  Memory() : fd_(::memfd_create("output", MFD_CLOEXEC)), output(fd_) {}
  ~Memory() { ::close(fd_); }
  Memory(const Memory&) = delete;
  Memory& operator=(const Memory&) = delete;

  std::string text() const {
    std::string contents(static_cast<std::size_t>(::lseek(fd_, 0, SEEK_END)), '\0');
    const ssize_t count = ::pread(fd_, contents.data(), contents.size(), 0);
    return contents.substr(0, count < 0 ? 0 : static_cast<std::size_t>(count));
  }
  std::vector<std::string> lines() const {
    std::vector<std::string> result;
    std::istringstream stream(text());
    for (std::string line; std::getline(stream, line);) result.push_back(line);
    return result;
  }

 private:
  const int fd_;

 public:
  Output output;
};

const PlannedEntry Paint{Action::Update, "com.paint", "2.0", "1.0", "Paint"};
const Summary Mixed{{"com.a"},
                    {"com.paint"},
                    {"com.old"},
                    {{"com.bad", "damaged", "bad.zip"}, {"x.zip", "no archive", "x.zip"}},
                    {{"com.same", "version 1 is installed", true}, {"com.no", "forbidden", false}}};

class Reporting : public ::testing::Test {
 protected:
  std::vector<std::string> told(const ReportOptions& options, const std::vector<Event>& events) {
    Memory memory;
    {
      const auto reporter = makeReporter(memory.output, errors.output, options);
      for (const Event& event : events) reporter->report(event);
    }
    return memory.lines();
  }
  std::vector<std::string> json(const std::vector<Event>& events) {
    return told({.json = true}, events);
  }
  std::string onTerminal(const std::vector<Event>& events, bool colour) {
    Memory memory;
    {
      TextReporter reporter(memory.output, errors.output, {}, true, colour);
      for (const Event& event : events) reporter.report(event);
    }
    return memory.text();
  }

  Memory errors;
};

TEST_F(Reporting, GivesOneJsonObjectPerEvent) {
  EXPECT_THAT(
      json({PackageProblem{"x.zip", true, "bad"}, Paint, PlaceholderSwept{"a"}, DeletedOnPhone{"a"},
            TransferProgress{"a", "A", 5, 10}, TransferEnded{"a", "A", {}},
            TransferEnded{"a", "A", "gone"}, InstallEnded{"a", {}, "a.zip"},
            InstallEnded{"a", "damaged"}, InstallEnded{"a", "damaged", "a.zip"},
            ClientLogLine{LogChannel::TWLogCategorySyncBundle, LogLevel::Error, "oh"},
            Interrupted{}, SyncBroken{"why"}}),
      ElementsAre(
          R"({"event":"package-problem","file":"x.zip","reason":"bad"})",
          R"({"event":"plan","action":"update","identifier":"com.paint","version":"2.0","installedVersion":"1.0","name":"Paint"})",
          R"({"event":"placeholder-removed","identifier":"a"})",
          R"({"event":"deleted-on-phone","identifier":"a"})",
          R"({"event":"transfer","identifier":"a","name":"A","sent":5,"total":10})",
          R"({"event":"transfer-ended","identifier":"a","success":true})",
          R"({"event":"transfer-ended","identifier":"a","success":false,"reason":"gone"})",
          R"({"event":"install-ended","identifier":"a","success":true})",
          R"({"event":"install-ended","identifier":"a","success":false,"reason":"damaged"})",
          R"({"event":"install-ended","identifier":"a","success":false,"reason":"damaged","file":"a.zip"})",
          R"({"event":"log","channel":"TWLogCategorySyncBundle","level":"error","text":"oh"})",
          R"({"event":"interrupted"})", R"({"event":"error","message":"why"})"));
}

TEST_F(Reporting, TellsARestoreInJson) {
  EXPECT_THAT(
      json({DataProgress{"a", "A", 5, 10}, DataEnded{"a", {}}, DataEnded{"a", "damaged"},
            PlaceholderStands{"a", "A", true}, Notice{"by the way"}}),
      ElementsAre(R"({"event":"data","identifier":"a","name":"A","done":5,"total":10})",
                  R"({"event":"data-ended","identifier":"a","success":true})",
                  R"({"event":"data-ended","identifier":"a","success":false,"reason":"damaged"})",
                  R"({"event":"placeholder","identifier":"a","name":"A","demoted":true})",
                  R"({"event":"notice","message":"by the way"})"));
}

TEST_F(Reporting, TellsARestoreInPlainLines) {
  const PlannedEntry planned{Action::Install, "com.a", "1.0", "", "A"};
  EXPECT_THAT(
      told({}, {planned, DataProgress{"com.a", "A", 5, 10}, DataEnded{"com.a", {}},
                PlaceholderStands{"com.a", "A", false}, PlaceholderStands{"com.b", "B", true},
                Notice{"by the way"}}),
      ElementsAre("restored   A 1.0 (com.a) as a placeholder",
                  "restored   B (com.b) as a demoted placeholder", "note       by the way"));
  EXPECT_THAT(told({.verbose = true}, {DataEnded{"com.a", {}}, DataEnded{"com.b", "damaged"}}),
              ElementsAre("data       com.a"));
  const std::string text = onTerminal({DataProgress{"a", "A\x1b[2J", 5, 10}}, false);
  EXPECT_THAT(text, HasSubstr("Data of A"));
  EXPECT_THAT(text, HasSubstr(" 50%  5 B of 10 B"));
  EXPECT_THAT(text, Not(HasSubstr("\x1b[2J")));
}

TEST_F(Reporting, TellsABackupInJson) {
  const BackupSummary summary{{"a"}, {{"b", "damaged"}}, true};
  EXPECT_THAT(
      json({SavingProgress{"a", "A", 5, 1, 2}, ApplicationSaved{"a", "A", {}},
            ApplicationSaved{"b", "B", "damaged"}, summary}),
      ElementsAre(
          R"({"event":"saving","identifier":"a","name":"A","bytes":5,"number":1,"count":2})",
          R"({"event":"saved","identifier":"a","name":"A","success":true})",
          R"({"event":"saved","identifier":"b","name":"B","success":false,"reason":"damaged"})",
          R"({"event":"summary","saved":["a"],"failed":[{"identifier":"b","reason":"damaged"}]})"));
}

TEST_F(Reporting, TellsABackupInPlainLines) {
  const ApplicationSaved saved{"com.a", "A\n", {}};
  const BackupSummary summary{{"com.a", "com.c"}, {{"com.b", "damaged"}}, true};
  EXPECT_THAT(told({}, {SavingProgress{"com.a", "A", 5, 1, 2}, saved, summary}),
              ElementsAre("failed     com.b: damaged", "done       2 saved, 1 failed"));
  EXPECT_THAT(told({.verbose = true}, {saved, ApplicationSaved{"com.b", "B", "damaged"}}),
              ElementsAre("saved      A\uFFFD (com.a)"));
  EXPECT_THAT(told({}, {BackupSummary{{}, {}, true}}),
              ElementsAre("done       no applications to save"));
  EXPECT_THAT(told({}, {BackupSummary{}}), ElementsAre("stopped    no backup was made"));
  const std::string text = onTerminal({SavingProgress{"a", "A\x1b[2J", 5000, 3, 5}}, false);
  EXPECT_THAT(text, HasSubstr("Saving A"));
  EXPECT_THAT(text, HasSubstr(" 40%  3 of 5, 5.0 kB"));
  EXPECT_THAT(text, Not(HasSubstr("\x1b[2J")));
}

TEST_F(Reporting, GivesTheSummaryAsPromised) {
  EXPECT_THAT(
      json({Mixed, Summary{}}),
      ElementsAre(
          R"({"event":"summary","installed":["com.a"],"updated":["com.paint"],"downgraded":[],"deleted":["com.old"],"failed":[{"identifier":"com.bad","reason":"damaged","file":"bad.zip"},{"identifier":"x.zip","reason":"no archive","file":"x.zip"}],"skipped":[{"identifier":"com.same","reason":"version 1 is installed","upToDate":true},{"identifier":"com.no","reason":"forbidden","upToDate":false}],"dataRestored":[]})",
          R"({"event":"summary","installed":[],"updated":[],"downgraded":[],"deleted":[],"failed":[],"skipped":[],"dataRestored":[]})"));
}

TEST_F(Reporting, KeepsJsonWholeWhateverAPackageHolds) {
  const auto lines = json({PackageProblem{"a\nb\x1b\xff.zip", true, "\"quoted\"\\"}});
  EXPECT_THAT(lines,
              ElementsAre("{\"event\":\"package-problem\",\"file\":\"a\\nb\\u001b\uFFFD.zip\","
                          "\"reason\":\"\\\"quoted\\\"\\\\\"}"));
}

TEST_F(Reporting, LeavesOnlyErrorsAndTheSummaryOfQuietJson) {
  const auto lines = told({.json = true, .quiet = true},
                          {Paint, TransferProgress{"a", "A", 5, 10}, SyncBroken{"x"}, Summary{}});
  ASSERT_EQ(lines.size(), 2U);
  EXPECT_THAT(lines[0], HasSubstr("error"));
  EXPECT_THAT(lines[1], HasSubstr("summary"));
}

TEST_F(Reporting, WritesPlainLinesWhereThereIsNoTerminal) {
  EXPECT_THAT(
      told({}, {Paint, DeletedOnPhone{"com.gone"}, TransferProgress{"com.paint", "Paint", 5, 10},
                TransferEnded{"com.paint", "Paint", {}}, InstallWaiting{"com.paint"},
                InstallEnded{"com.paint", {}}, InstallEnded{"com.new", {}}, Mixed}),
      ElementsAre(
          "gone       com.gone was deleted on the phone",
          "waiting    Paint 2.0 (com.paint) is open on the phone; it is installed when it "
          "quits (appsync quit com.paint), next try in 30 s",
          "updated    Paint 2.0 (com.paint)", "installed  com.new", "deleted    com.old",
          "skipped    com.no: forbidden", "failed     com.bad: damaged [bad.zip]",
          "failed     x.zip: no archive",
          "done       1 installed, 1 updated, 1 deleted, 2 failed, 1 skipped, 1 up to date"));
}

TEST_F(Reporting, SaysWhenThereWasNothingToDo) {
  EXPECT_THAT(told({}, {Summary{}}), ElementsAre("done       nothing to do"));
}

TEST_F(Reporting, SaysWhenADryRunFindsNothingToDo) {
  Summary summary;
  summary.skipped = {{"com.a", "version 1 is installed", true},
                     {"com.b", "it is a system application"}};
  EXPECT_THAT(told({.showPlan = true}, {summary}),
              ElementsAre("skipped    com.b: it is a system application",
                          "done       nothing to do: 1 skipped, 1 up to date"));
}

TEST_F(Reporting, TellsADowngradeAsOne) {
  PlannedEntry back = Paint;
  back.action = Action::Downgrade;
  Summary summary;
  summary.downgraded = {"com.paint"};
  EXPECT_THAT(told({}, {back, InstallEnded{"com.paint", {}}, summary}),
              ElementsAre("downgraded Paint 2.0 (com.paint)", "done       1 downgraded"));
}

TEST_F(Reporting, ShowsThePlanOfADryRun) {
  EXPECT_THAT(told({.showPlan = true}, {Paint, Summary{}}),
              ElementsAre("update     Paint 2.0 (com.paint) from 1.0"));
}

TEST_F(Reporting, WritesOnlyFailuresWhenQuietAndThemAsErrors) {
  EXPECT_TRUE(told({.quiet = true}, {Paint, InstallEnded{"com.a", {}}, Mixed}).empty());
  EXPECT_THAT(errors.lines(), ElementsAre("appsync: failed com.bad: damaged [bad.zip]",
                                          "appsync: failed x.zip: no archive"));
}

TEST_F(Reporting, ShowsTheClientsLogWhenVerbose) {
  const ClientLogLine line{LogChannel::TWLogCategorySyncBundle, LogLevel::Info, "a\x1b]0;b"};
  EXPECT_THAT(told({.verbose = true}, {line}), ElementsAre("log        info: a\uFFFD]0;b"));
}

TEST_F(Reporting, LetsNoEscapeSequenceOfAPackageThrough) {
  PlannedEntry evil = Paint;
  evil.identifier = "com.evil";
  evil.name = "Evil\x1b[2J";
  evil.version = "1\x07";
  const std::string text = onTerminal(
      {evil, TransferProgress{"com.evil", evil.name, 1, 2},
       TransferEnded{"com.evil", evil.name, {}}, InstallWaiting{"com.evil"},
       InstallEnded{"com.evil", {}}, PackageProblem{"x\x1b[1m", true, "\x1b[1m"},
       SyncBroken{"\x1b[1m"}, Summary{{}, {}, {"com.evil"}, {{"\x1b[1m", "\x1b[1m"}}, {}}},
      false);
  EXPECT_THAT(text, Not(HasSubstr("\x1b[2J")));
  EXPECT_THAT(text, Not(HasSubstr("\x1b[1m")));
  EXPECT_THAT(text, Not(HasSubstr("\x07")));
}

TEST_F(Reporting, DrawsABarOnATerminalAndRestoresTheCursor) {
  const std::string text = onTerminal(
      {Paint, TransferProgress{"com.paint", "Paint", 500, 1000},
       TransferEnded{"com.paint", "Paint", {}}, InstallEnded{"com.paint", {}}, Summary{}},
      false);
  EXPECT_THAT(text, HasSubstr("Sending Paint  "));
  EXPECT_THAT(text, HasSubstr(" 50%  500 B of 1.0 kB"));
  EXPECT_THAT(text, HasSubstr("Installing Paint 2.0 (com.paint) ..."));
  EXPECT_LT(text.find("\x1b[?25l"), text.rfind("\x1b[?25h"));
  EXPECT_EQ(text.find("\x1b[32m"), std::string::npos);
}

TEST_F(Reporting, RestoresTheCursorWhenTheSyncEndsEarly) {
  const std::string text = onTerminal({TransferProgress{"a", "A", 5, 10}}, false);
  EXPECT_TRUE(text.ends_with("\x1b[?25h"));
}

TEST_F(Reporting, ColoursWhatATerminalShows) {
  EXPECT_THAT(onTerminal({InstallEnded{"com.a", {}}}, true),
              HasSubstr("\x1b[32minstalled \x1b[0m com.a"));
}

TEST(Outputs, KeepTheFirstErrorAndDropTheRest) {
  int ends[2];
  ASSERT_EQ(::pipe(ends), 0);
  ::close(ends[0]);
  const auto previous = ::signal(SIGPIPE, SIG_IGN);
  {
    Output output(ends[1]);
    output.line("a");
    output.line("b");
    EXPECT_EQ(output.error(), EPIPE);
    EXPECT_FALSE(output.isTerminal());
  }
  ::signal(SIGPIPE, previous);
  ::close(ends[1]);
}

}  // namespace
}  // namespace appsync::host
