// Two processes on one store. Helper processes are this test binary started again with
// TESSEL_TEST_CHILD naming a job: a fresh process, as another `tessel` or tool process would
// be, rather than a fork that inherits this process's SQLite state.
#include <fcntl.h>
#include <signal.h>
#include <sqlite3.h>
#include <sys/wait.h>
#include <unistd.h>

#include <iterator>
#include <sstream>

#include "tessel/exception.h"
#include "tessel/schema.h"
#include "tessel/test_store.h"

namespace tessel::testing {
namespace {

const std::vector<std::string> kContacts{std::string(TesselEntity_Contacts_Contact)};
constexpr std::size_t kChurnBatch = 2000;

// The jobs a helper process can do; the exit status tells the parent how it went.
int runChildJob(const std::string& job) {
  std::istringstream words(job);
  const std::vector<std::string> args{std::istream_iterator<std::string>(words), {}};
  auto store = Store::open(args.at(1), StoreOpening::MustExist);
  if (args[0] == "cancel") return store->cancelSession(args.at(2)) ? 0 : 1;
  if (args[0] == "begin") {
    try {
      Session::begin(*store->clientWithIdentifier(args.at(2)), kContacts)->finishSyncing();
      return 0;
    } catch (const Exception& e) {
      return e.name() == TesselSessionRunningException ? 3 : 4;
    }
  }
  if (args[0] == "abandon") {
    auto session = Session::begin(*store->clientWithIdentifier(args.at(2)), kContacts);
    _exit(0);  // gone without ending the session, as a crashed process would be
  }
  if (args[0] == "churn") {
    int signalFd = std::stoi(args.at(2));
    for (int batch = 0;; ++batch) {
      std::vector<Record> records;
      for (std::size_t i = 0; i < kChurnBatch; ++i)
        records.push_back(
            contact(std::to_string(batch) + "-" + std::to_string(i), std::string(200, 'x')));
      store->putRecords(records);
      if (batch == 0) {
        char ready = 1;
        if (write(signalFd, &ready, 1) != 1) return 5;
      }
    }
  }
  return 2;
}

const bool kRanAsChild = [] {
  const char* job = getenv("TESSEL_TEST_CHILD");
  if (!job) return false;
  int status = 9;
  try {
    status = runChildJob(job);
  } catch (...) {
  }
  _exit(status);
}();

pid_t startChild(const std::string& job) {
  pid_t pid = fork();
  if (pid == 0) {
    setenv("TESSEL_TEST_CHILD", job.c_str(), 1);
    char* argv[] = {const_cast<char*>("tessel_test_child"), nullptr};
    execv("/proc/self/exe", argv);
    _exit(127);
  }
  return pid;
}

int exitStatusOf(pid_t pid) {
  int status = 0;
  waitpid(pid, &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

int runChild(const std::string& job) {
  return exitStatusOf(startChild(job));
}

class TwoProcesses : public StoreTest {
 protected:
  void SetUp() override {
    StoreTest::SetUp();
    client_ = store_->registerClient("Z1", "Player", kContacts);
  }
  std::string store() const { return storePath_.string(); }
  std::unique_ptr<Client> client_;
};

TEST_F(TwoProcesses, ACancelFromAnotherProcessIsSeenAndLaterCallsRaise) {
  store_->putRecords({contact("c1", "Ann")});
  auto session = Session::begin(*client_, kContacts);
  session->prepareToPullChanges(kContacts);
  session->clientAcceptedChanges("c1");
  EXPECT_FALSE(session->isCancelled());

  ASSERT_EQ(runChild("cancel " + store() + " Z1"), 0);
  EXPECT_TRUE(session->isCancelled());
  EXPECT_THROW(session->clientCommittedAcceptedChanges(), Exception);
  EXPECT_THROW(session->changeEnumerator(kContacts), Exception);
  EXPECT_THROW(session->finishSyncing(), Exception);
  session->cancelSyncing();
  EXPECT_EQ(client_->mirrorSize(), 0u);
  // Nothing runs any more: a second cancel finds nothing.
  EXPECT_EQ(runChild("cancel " + store() + " Z1"), 1);
}

TEST_F(TwoProcesses, ASecondSessionInAnotherProcessRaisesUntilTheFirstEnds) {
  auto session = Session::begin(*client_, kContacts);
  EXPECT_EQ(runChild("begin " + store() + " Z1"), 3);
  session->finishSyncing();
  EXPECT_EQ(runChild("begin " + store() + " Z1"), 0);

  // A session left by a dead process counts as cancelled and blocks nothing.
  ASSERT_EQ(runChild("abandon " + store() + " Z1"), 0);
  EXPECT_EQ(client_->lastSession()->outcome, SessionOutcome::Cancelled);
  Session::begin(*client_, kContacts)->finishSyncing();
  ASSERT_EQ(runChild("abandon " + store() + " Z1"), 0);
  EXPECT_TRUE(store_->cancelSession("Z1"));
  EXPECT_FALSE(store_->cancelSession("Z1"));
}

TEST_F(TwoProcesses, AWriterKilledInTheMiddleOfATransactionLeavesAConsistentStore) {
  int pipeFds[2];
  ASSERT_EQ(pipe(pipeFds), 0);
  pid_t writer = startChild("churn " + store() + " " + std::to_string(pipeFds[1]));
  close(pipeFds[1]);
  char ready = 0;
  ASSERT_EQ(read(pipeFds[0], &ready, 1), 1);
  close(pipeFds[0]);
  // The writer spends nearly all its time inside a transaction of its next batch.
  kill(writer, SIGKILL);
  int status = 0;
  waitpid(writer, &status, 0);
  ASSERT_TRUE(WIFSIGNALED(status));

  store_.reset();
  store_ = Store::open(storePath_, StoreOpening::MustExist);
  std::size_t count = store_->recordCount();
  EXPECT_GE(count, kChurnBatch);
  EXPECT_EQ(count % kChurnBatch, 0u) << "a batch was half written";
  EXPECT_EQ(static_cast<std::size_t>(store_->generation()), count);

  sqlite3* db = nullptr;
  ASSERT_EQ(sqlite3_open(storePath_.c_str(), &db), SQLITE_OK);
  sqlite3_stmt* check = nullptr;
  sqlite3_prepare_v2(db, "PRAGMA integrity_check", -1, &check, nullptr);
  ASSERT_EQ(sqlite3_step(check), SQLITE_ROW);
  EXPECT_STREQ(reinterpret_cast<const char*>(sqlite3_column_text(check, 0)), "ok");
  sqlite3_finalize(check);
  sqlite3_close(db);

  // And it takes writes and sessions again.
  store_->putRecords({contact("after", "Zed")});
  auto session = Session::begin(*client_, kContacts);
  session->prepareToPullChanges(kContacts);
  EXPECT_EQ(drain(*session, kContacts).size(), count + 1);
}

}  // namespace
}  // namespace tessel::testing
