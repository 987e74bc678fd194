#include "platform/run_loop.h"

#include <gtest/gtest.h>
#include <poll.h>
#include <unistd.h>

#include <chrono>
#include <string>
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

TEST(RunLoopModes, ASourceIsServedInItsModesOnly) {
  RunLoop loop;
  Pipe other, both;
  int otherCalls = 0, bothCalls = 0;
  loop.addDescriptor(other.readEnd(), POLLIN, {"Other"}, [&](int, short) {
    ++otherCalls;
    other.drain();
  });
  loop.addDescriptor(both.readEnd(), POLLIN, {"A", "B"}, [&](int, short) { ++bothCalls; });
  other.signal();
  EXPECT_EQ(loop.runInMode("A", 0.2, ReturnAfter::SourceHandled), RunResult::TimedOut);
  EXPECT_EQ(otherCalls, 0);
  EXPECT_EQ(loop.runInMode("Other", 1.0, ReturnAfter::SourceHandled), RunResult::SourceHandled);
  EXPECT_EQ(otherCalls, 1);
  both.signal();  // stays readable: the callback does not drain it
  EXPECT_EQ(loop.runInMode("A", 1.0, ReturnAfter::SourceHandled), RunResult::SourceHandled);
  EXPECT_EQ(loop.runInMode("B", 1.0, ReturnAfter::SourceHandled), RunResult::SourceHandled);
  EXPECT_EQ(bothCalls, 2);
  EXPECT_EQ(loop.runInMode("C", 1.0, ReturnAfter::SourceHandled), RunResult::NoSources);
}

TEST(RunLoopReturnAfter, SourceHandledServesOneReadySourcePerRunWithoutWaiting) {
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
  EXPECT_EQ(loop.runInMode("M", 0.0, ReturnAfter::SourceHandled), RunResult::TimedOut);
  a.signal();
  b.signal();
  EXPECT_EQ(loop.runInMode("M", -1.0, ReturnAfter::SourceHandled), RunResult::SourceHandled);
  EXPECT_EQ(calls, 1);
  EXPECT_EQ(loop.runInMode("M", 1.0, ReturnAfter::SourceHandled), RunResult::SourceHandled);
  EXPECT_EQ(calls, 2);
}

TEST(RunLoopTime, TimersFireAfterTheirDelayOnceOrUntilTheTimeElapsed) {
  RunLoop loop;
  RunLoop::Clock::time_point firedAt{};
  auto start = RunLoop::Clock::now();
  auto id =
      loop.addTimer(200ms, RunLoop::Repeat::Once, {"M"}, [&] { firedAt = RunLoop::Clock::now(); });
  EXPECT_EQ(loop.runInMode("M", 5.0, ReturnAfter::SourceHandled), RunResult::SourceHandled);
  EXPECT_GE(std::chrono::duration<double>(firedAt - start).count(), 0.2);
  EXPECT_FALSE(loop.hasSource(id));

  int ticks = 0;
  loop.addTimer(50ms, RunLoop::Repeat::Periodically, {"M"}, [&] { ++ticks; });
  start = RunLoop::Clock::now();
  EXPECT_EQ(loop.runInMode("M", 0.4, ReturnAfter::TimeElapsed), RunResult::TimedOut);
  EXPECT_GE(secondsSince(start), 0.4);
  EXPECT_GE(ticks, 3);
}

TEST(RunLoopRemoval, CallbacksMayRemoveAndAddSourcesWhileTheLoopRuns) {
  RunLoop loop;
  Pipe a, b, self;
  std::vector<char> order;
  RunLoop::SourceId idA = 0, idB = 0, idSelf = 0;
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

  // A source removing itself keeps its callback's state alive while it runs.
  std::string captured = "kept alive while it runs";
  idSelf = loop.addDescriptor(self.readEnd(), POLLIN, {"S"}, [&, captured](int, short) {
    loop.removeSource(idSelf);
    EXPECT_EQ(captured, "kept alive while it runs");
    loop.addTimer(0ms, RunLoop::Repeat::Once, {"S"}, [&] { order.push_back('t'); });
  });
  self.signal();
  EXPECT_EQ(loop.runInMode("S", 1.0, ReturnAfter::TimeElapsed), RunResult::NoSources);
  EXPECT_FALSE(loop.hasSource(idSelf));
  EXPECT_EQ(order.back(), 't');
}

}  // namespace
}  // namespace zt::platform
