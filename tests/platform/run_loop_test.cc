#include "platform/run_loop.h"

#include <gtest/gtest.h>
#include <poll.h>
#include <unistd.h>

#include <chrono>
#include <string>
#include <thread>
#include <vector>

namespace zt::platform {
namespace {

using namespace std::chrono_literals;
using RunResult = RunLoop::RunResult;
using ReturnAfter = RunLoop::ReturnAfter;

double secondsSince(RunLoop::Clock::time_point start) {
  return std::chrono::duration<double>(RunLoop::Clock::now() - start).count();
}

// A pipe whose read end is a descriptor source; writing a byte makes it ready.
class Pipe {
 public:
  Pipe() { EXPECT_EQ(pipe(fds_), 0); }
  ~Pipe() {
    close(fds_[0]);
    close(fds_[1]);
  }
  int readEnd() const { return fds_[0]; }
  void signal() { ASSERT_EQ(write(fds_[1], "x", 1), 1); }
  void drain() {
    char byte;
    ASSERT_EQ(read(fds_[0], &byte, 1), 1);
  }

 private:
  int fds_[2] = {-1, -1};
};

TEST(RunLoopModes, SourcesOfAnotherModeAreNotServed) {
  RunLoop loop;
  Pipe other, mine;
  int otherCalls = 0, myCalls = 0;
  loop.addDescriptor(other.readEnd(), POLLIN, {"Other"}, [&](int, short) {
    ++otherCalls;
    other.drain();
  });
  loop.addDescriptor(mine.readEnd(), POLLIN, {"ZetoMode"}, [&](int, short) { ++myCalls; });
  other.signal();
  EXPECT_EQ(loop.runInMode("ZetoMode", 0.2, ReturnAfter::SourceHandled), RunResult::TimedOut);
  EXPECT_EQ(otherCalls, 0);
  EXPECT_EQ(myCalls, 0);
  EXPECT_EQ(loop.runInMode("Other", 1.0, ReturnAfter::SourceHandled), RunResult::SourceHandled);
  EXPECT_EQ(otherCalls, 1);
}

TEST(RunLoopModes, SourceInSeveralModesIsServedInEach) {
  RunLoop loop;
  Pipe p;
  std::vector<short> seen;
  loop.addDescriptor(p.readEnd(), POLLIN, {"A", "B"}, [&](int fd, short revents) {
    EXPECT_EQ(fd, p.readEnd());
    seen.push_back(revents);
  });
  p.signal();  // stays readable: the callback does not drain it
  EXPECT_EQ(loop.runInMode("A", 1.0, ReturnAfter::SourceHandled), RunResult::SourceHandled);
  EXPECT_EQ(loop.runInMode("B", 1.0, ReturnAfter::SourceHandled), RunResult::SourceHandled);
  ASSERT_EQ(seen.size(), 2u);
  EXPECT_TRUE(seen[0] & POLLIN);
  EXPECT_EQ(loop.runInMode("C", 1.0, ReturnAfter::SourceHandled), RunResult::NoSources);
}

TEST(RunLoopTime, ZeroOrNegativeTimeServesWhatIsReadyWithoutWaiting) {
  RunLoop loop;
  Pipe p;
  int calls = 0;
  loop.addDescriptor(p.readEnd(), POLLIN, {"M"}, [&](int, short) {
    ++calls;
    p.drain();
  });
  EXPECT_EQ(loop.runInMode("M", 0.0, ReturnAfter::SourceHandled), RunResult::TimedOut);
  p.signal();
  EXPECT_EQ(loop.runInMode("M", -1.0, ReturnAfter::SourceHandled), RunResult::SourceHandled);
  EXPECT_EQ(calls, 1);
}

TEST(RunLoopTime, TimerFiresAfterItsDelayAndOnlyOnce) {
  RunLoop loop;
  RunLoop::Clock::time_point firedAt{};
  auto start = RunLoop::Clock::now();
  auto id =
      loop.addTimer(200ms, RunLoop::Repeat::Once, {"M"}, [&] { firedAt = RunLoop::Clock::now(); });
  EXPECT_EQ(loop.runInMode("M", 5.0, ReturnAfter::SourceHandled), RunResult::SourceHandled);
  EXPECT_GE(std::chrono::duration<double>(firedAt - start).count(), 0.2);
  EXPECT_FALSE(loop.hasSource(id));
  EXPECT_EQ(loop.runInMode("M", 0.1, ReturnAfter::SourceHandled), RunResult::NoSources);
}

TEST(RunLoopReturnAfter, SourceHandledServesOneSourcePerRun) {
  RunLoop loop;
  Pipe a, b;
  int calls = 0;
  auto serve = [&](Pipe& p) {
    return [&calls, &p](int, short) {
      ++calls;
      p.drain();
    };
  };
  loop.addDescriptor(a.readEnd(), POLLIN, {"M"}, serve(a));
  loop.addDescriptor(b.readEnd(), POLLIN, {"M"}, serve(b));
  a.signal();
  b.signal();
  EXPECT_EQ(loop.runInMode("M", 1.0, ReturnAfter::SourceHandled), RunResult::SourceHandled);
  EXPECT_EQ(calls, 1);
  EXPECT_EQ(loop.runInMode("M", 1.0, ReturnAfter::SourceHandled), RunResult::SourceHandled);
  EXPECT_EQ(calls, 2);
  EXPECT_EQ(loop.runInMode("M", 0.1, ReturnAfter::SourceHandled), RunResult::TimedOut);
}

TEST(RunLoopReturnAfter, TimeElapsedKeepsServingUntilTheEnd) {
  RunLoop loop;
  int ticks = 0;
  loop.addTimer(50ms, RunLoop::Repeat::Periodically, {"M"}, [&] { ++ticks; });
  auto start = RunLoop::Clock::now();
  EXPECT_EQ(loop.runInMode("M", 0.4, ReturnAfter::TimeElapsed), RunResult::TimedOut);
  EXPECT_GE(secondsSince(start), 0.4);
  EXPECT_GE(ticks, 3);
}

TEST(RunLoopRemoval, SourceMayRemoveItselfFromItsCallback) {
  RunLoop loop;
  Pipe p;
  int calls = 0;
  RunLoop::SourceId id = 0;
  std::string captured = "kept alive while it runs";
  id = loop.addDescriptor(p.readEnd(), POLLIN, {"M"}, [&, captured](int, short) {
    loop.removeSource(id);
    ++calls;
    EXPECT_EQ(captured, "kept alive while it runs");  // the callback's state outlives removal
  });
  p.signal();
  EXPECT_EQ(loop.runInMode("M", 1.0, ReturnAfter::SourceHandled), RunResult::SourceHandled);
  EXPECT_FALSE(loop.hasSource(id));
  EXPECT_EQ(loop.runInMode("M", 0.1, ReturnAfter::TimeElapsed), RunResult::NoSources);
  EXPECT_EQ(calls, 1);
}

TEST(RunLoopRemoval, RemovedReadySourceIsNotCalledInTheSameRound) {
  RunLoop loop;
  Pipe a, b;
  std::vector<char> order;
  RunLoop::SourceId idA = 0, idB = 0;
  // Whichever runs first removes the other; both are ready in the same poll.
  idA = loop.addDescriptor(a.readEnd(), POLLIN, {"M"}, [&](int, short) {
    order.push_back('a');
    loop.removeSource(idB);
    a.drain();
  });
  idB = loop.addDescriptor(b.readEnd(), POLLIN, {"M"}, [&](int, short) {
    order.push_back('b');
    loop.removeSource(idA);
    b.drain();
  });
  a.signal();
  b.signal();
  loop.runInMode("M", 0.2, ReturnAfter::TimeElapsed);
  EXPECT_EQ(order.size(), 1u);
}

TEST(RunLoopRemoval, CallbacksMayAddSources) {
  RunLoop loop;
  std::vector<int> fired;
  loop.addTimer(0ms, RunLoop::Repeat::Once, {"M"}, [&] {
    fired.push_back(1);
    loop.addTimer(0ms, RunLoop::Repeat::Once, {"M"}, [&] { fired.push_back(2); });
  });
  EXPECT_EQ(loop.runInMode("M", 1.0, ReturnAfter::TimeElapsed), RunResult::NoSources);
  EXPECT_EQ(fired, (std::vector<int>{1, 2}));
}

TEST(RunLoopCurrent, OneLoopPerThread) {
  RunLoop* mine = &RunLoop::current();
  EXPECT_EQ(mine, &RunLoop::current());
  RunLoop* theirs = nullptr;
  std::thread([&] { theirs = &RunLoop::current(); }).join();
  EXPECT_NE(mine, theirs);
}

}  // namespace
}  // namespace zt::platform
