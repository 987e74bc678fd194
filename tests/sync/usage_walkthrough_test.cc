// docs/USAGE.md, walked: the commands of its `sh` blocks run in order through bash, with the
// installed programs, in a home folder of the test's own, on a virtual player and without a
// session bus. What they leave is then checked, and so are the messages a person meets on the
// way (another store, the version, the tool's defaults and settings).
#include <gtest/gtest.h>

#include <fstream>
#include <memory>
#include <set>
#include <sstream>
#include <string>
#include <tuple>
#include <vector>

#include "support/files.h"
#include "support/process.h"
#include "support/radicale_server.h"
#include "sync/synctool_fixture.h"

namespace zt::sync::test_support {
namespace {

const fs::path kSource = fs::path(ZT_TEST_DATA_DIR) / ".." / "..";

// The lines of USAGE.md that need root, a systemd session or a whole build; each must still be
// in the page, so that the list follows it.
const std::set<std::string> kNotRunHere = {
    "bash scripts/setup                         # the Debian packages (as root, or through sudo)",
    "cmake --preset default && cmake --build --preset default",
    "sudo cp contrib/udev/70-zeto-sync.rules /etc/udev/rules.d/",
    "sudo udevadm control --reload",
    "systemctl --user daemon-reload",
};

std::vector<std::string> usageCommands() {
  std::ifstream in(kSource / "docs" / "USAGE.md");
  std::vector<std::string> commands;
  bool inBlock = false;
  for (std::string line; std::getline(in, line);) {
    if (line.rfind("```", 0) == 0) {
      inBlock = !inBlock && line == "```sh";
      continue;
    }
    if (inBlock && !line.empty()) commands.push_back(line);
  }
  return commands;
}

class UsageWalkthrough : public SynctoolTest {
 protected:
  void SetUp() override {
    SynctoolTest::SetUp();
    home_ = folder() / "home";
    fs::create_directories(home_ / "Exports");
    fs::create_directories(home_ / ".local" / "share" / "contacts");
    const fs::path samples = kSource / "samples";
    fs::copy_file(samples / "contacts" / "friends-and-colleagues.vcf",
                  home_ / "Exports" / "contacts.vcf");
    fs::copy(samples / "contacts" / "family-vdir",
             home_ / ".local" / "share" / "contacts" / "personal");
    fs::copy_file(samples / "calendars" / "work.ics", home_ / "Exports" / "work.ics");
    fs::copy_file(samples / "calendars" / "home.ics", home_ / "Exports" / "family.ics");
    Player player{std::string(kPlayerID)};
    player.checkpoint = samples / "zeto" / "self-description.plist";
    setPlayers({player});
  }

  // The page's server, dav.example.org, is a Radicale on 127.0.0.1 holding a calendar and an
  // address book; its password is in the file the page has the person write.
  void startServer() {
    const fs::path credentials = home_ / ".config" / "tessel" / "dav";
    fs::create_directories(credentials.parent_path());
    zt::test_support::writeFile(credentials, "you:secret\n");
    fs::permissions(credentials, fs::perms::owner_read | fs::perms::owner_write);
    server_ = std::make_unique<zt::test_support::RadicaleServer>(folder() / "dav", credentials);
    ASSERT_TRUE(server_->listening());
    ASSERT_EQ(server_->makeCalendar("team"), "201");
    ASSERT_EQ(server_->makeAddressBook("people"), "201");
    ASSERT_EQ(
        server_->request("PUT", "team/t1.ics", zt::test_support::eventText("t1", "Team lunch")),
        "201");
    ASSERT_EQ(server_->request("PUT", "people/p1.vcf",
                               zt::test_support::cardText("p1", "Grace Hopper"), "text/vcard"),
              "201");
  }

  // The test's environment as a person's: the default store in the home folder, the installed
  // programs first on PATH, no session bus.
  std::map<std::string, std::string> personEnvironment() const {
    std::map<std::string, std::string> env = environment();
    for (const char* name : {"TESSEL_STORE", "ZETOSYNCTOOL_DEFAULTS", "DBUS_SESSION_BUS_ADDRESS",
                             "XDG_DATA_HOME", "XDG_CONFIG_HOME"})
      env.erase(name);
    env["HOME"] = home_.string();
    env["PATH"] = (home_ / ".local" / "bin").string() + ":/usr/local/bin:/usr/bin:/bin";
    return env;
  }

  zt::test_support::ProcessRun bash(const std::string& script) {
    zt::test_support::ProcessOptions options;
    options.environment = personEnvironment();
    options.deadlineSeconds = 100;
    return zt::test_support::runProcess({"/bin/bash", "-c", script}, options);
  }

  fs::path home_;
  std::unique_ptr<zt::test_support::RadicaleServer> server_;
};

TEST_F(UsageWalkthrough, EveryCommandOfThePageRunsAndThePlayerEndsUpSynced) {
  if (!zt::test_support::RadicaleServer::installed()) GTEST_SKIP() << "radicale is not installed";
  startServer();
  std::string script = "set -e\ncd '" + kSource.string() + "'\n";
  std::set<std::string> skipped;
  for (std::string command : usageCommands()) {
    if (kNotRunHere.count(command) != 0) {
      skipped.insert(command);
      continue;
    }
    // The page's build folder is the one these tests were built in.
    if (const auto at = command.find("build/default"); at != std::string::npos)
      command.replace(at, 13, ZT_BUILD_DIR);
    if (const auto at = command.find("https://dav.example.org/you/"); at != std::string::npos)
      command.replace(at, 28, server_->home());
    script += "echo '>>> " + command.substr(0, command.find('\'')) + "'\n" + command + "\n";
  }
  EXPECT_EQ(skipped, kNotRunHere) << "a line of kNotRunHere left docs/USAGE.md";
  const auto run = bash(script);
  ASSERT_EQ(run.status, 0) << run.out << run.err;

  // The page's devices line, before the client was registered; and after it, registered.
  EXPECT_CONTAINS(run.out, "A27001A2B3C4D\t" + volume().string() +
                               "\tclient: zeto-A27001A2B3C4D\tnot registered: tessel client "
                               "register zeto-A27001A2B3C4D --contacts --calendars\n");
  EXPECT_CONTAINS(run.out, "zeto-A27001A2B3C4D\tMy Zeto\tcontacts, calendars\n");
  EXPECT_CONTAINS(run.out,
                  "  contacts: the members of Family (vcard-group/Family), Friends "
                  "(vcard-group/Friends)\n");
  // tessel sync found the tool beside it, followed its progress to the end and said what the
  // player holds.
  EXPECT_CONTAINS(run.out, "zeto-A27001A2B3C4D [##############################] 100.0% done");
  EXPECT_CONTAINS(run.out, "zeto-A27001A2B3C4D: synced: 31 contacts, 3 calendars\n");
  EXPECT_CONTAINS(zt::test_support::readFile(volume() / "Calendars/Tessel-Team.ics"),
                  "SUMMARY:Team lunch\r\n");
  EXPECT_CONTAINS(zt::test_support::utf8OfUtf16BigEndian(
                      zt::test_support::readFile(volume() / "Contacts/Tessel.vcf")),
                  "N:Grace Hopper;");
  EXPECT_CONTAINS(run.out, "AlwaysPushVCard = true\t# ");
  EXPECT_EQ(zt::test_support::readFile(home_ / ".config" / "zetosynctool" / "defaults.conf"),
            "AlwaysPushVCard = true\n");

  // Ordering put Home first and chose nothing: both calendars of the filter are on the player.
  for (const fs::path& made :
       {volume() / "Contacts/Tessel.vcf", volume() / "Calendars/Tessel-Work.ics",
        volume() / "Calendars/Tessel-Home.ics", home_ / ".local/bin/tessel",
        home_ / ".local/bin/zetosynctool", home_ / ".local/share/man/man1/tessel.1",
        home_ / ".local/share/man/man1/zetosynctool.1",
        home_ / ".config/systemd/user/zetosync@.service"})
    EXPECT_TRUE(fs::exists(made)) << made;

  // What the installed unit runs when udev names the player's serial number.
  std::string start;
  for (const std::string& line : zt::test_support::splitLines(
           zt::test_support::readFile(home_ / ".config/systemd/user/zetosync@.service")))
    if (line.rfind("ExecStart=", 0) == 0) start = line.substr(10);
  for (const auto& [specifier, value] : {std::pair<std::string, std::string>{"%h", home_.string()},
                                         {"%i", "000A27001A2B3C4D"},
                                         {"%%", "%"}})
    for (auto at = start.find(specifier); at != std::string::npos;
         at = start.find(specifier, at + value.size()))
      start.replace(at, specifier.size(), value);
  const auto unit = bash(start);
  EXPECT_EQ(unit.status, 0) << start << '\n' << unit.out << unit.err;
  EXPECT_CONTAINS(unit.out, "zeto-A27001A2B3C4D: synced: ");
}

TEST_F(UsageWalkthrough, TheMessagesMetOnTheWay) {
  const std::string tessel = TESSEL_TEST_BINARY;
  // A script, its status, and what it says in standard output and error.
  const std::tuple<std::string, int, std::string> steps[] = {
      {tessel + " --version", 0, "tessel 38\n"},
      {tessel + " --store other.db init", 0,
       "tessel: warning: zetosynctool reads " +
           (home_ / ".local" / "share" / "tessel" / "truth.db").string() +
           ", not other.db; set TESSEL_STORE=other.db where it runs"},
      {"TESSEL_STORE=$PWD/other.db " + tessel + " --store other.db records list", 0, ""},
      {tessel + " defaults set DebugLog maybe", 2, "the value of DebugLog is true or false"},
      {tessel + " defaults set Debuglog true", 2,
       "\"Debuglog\" is not a default of zetosynctool: DebugLog, AlwaysSyncContactImages, "
       "AlwaysPushVCard"},
      {tessel + " client set --help", 0, "  LastModDateForVCF           when the tool last wrote"},
      {tessel + " defaults --help", 0, "  AlwaysSyncContactImages: photos go to the player"},
  };
  for (const auto& [script, status, says] : steps) {
    SCOPED_TRACE(script);
    const auto run = bash("cd '" + folder().string() + "' && " + script);
    EXPECT_EQ(run.status, status) << run.out << run.err;
    EXPECT_CONTAINS(run.out + run.err, says);
    EXPECT_TRUE(!says.empty() || run.err.empty()) << run.err;
  }
  // The defaults file was never half-written by the refused values.
  EXPECT_FALSE(fs::exists(home_ / ".config" / "zetosynctool" / "defaults.conf"));
}

}  // namespace
}  // namespace zt::sync::test_support
