// Many commands at once, from many threads, while signals arrive.

#include "kovabackup/service/command.h"

#include "tests/service/command_fixture.h"

#include <atomic>
#include <memory>
#include <stdexcept>
#include <thread>

using KovaTest::CommandTest;
using KovaTest::Handler;
using KovaTest::Pipe;

namespace {

constexpr int kThreads = 8;
constexpr int kCommands = 1000;

class CommandThreads : public CommandTest {
protected:
  /// Runs work(n) for every n below count, shared among threads; work returns whether it was right.
  /// Returns: how often it was not.
  static int wrongInThreads(int count, const std::function<bool(int)> &work) {
    std::atomic<int> next{0};
    std::atomic<int> wrong{0};
    std::vector<std::thread> threads;
    for (int i = 0; i < kThreads; ++i) {
      threads.emplace_back([&] {
        for (int n = next++; n < count; n = next++) {
          wrong += work(n) ? 0 : 1;
        }
      });
    }
    for (std::thread &thread : threads) {
      thread.join();
    }
    return wrong;
  }

  /// One of several kinds of command, checked.
  static bool runsAsItShould(int n) {
    const std::string text = "text " + std::to_string(n);
    switch (n % 5) {
    case 0:
      return given({"exit", std::to_string(n % 100)}).run().code == n % 100;
    case 1: {
      const Result result = helper({"copy"}).input(text).capture(Stream::Out, 100).run();
      return result.ok() && result.out.text == text;
    }
    case 2:
      return given({"die", "9"}).ownGroup().run().code == 9;
    case 3: {
      int lines = 0;
      Command command = helper({"numbers", "100"});
      command.lines(Stream::Out, [&lines](std::string_view) { ++lines; });
      return command.run().ok() && lines == 100;
    }
    default: {
      const Pipe gate;
      Command command = helper({"await", "8"});
      const Result result = command.passFd(gate.readEnd(), 8).limit(Millis(n % 3)).run();
      return result.timedOut && result.end == End::Signalled;
    }
    }
  }
};

std::atomic<int> signalsSeen{0};

} // namespace

TEST_F(CommandThreads, RunThousandCommands) {
  EXPECT_EQ(0, wrongInThreads(kCommands, runsAsItShould));
}

TEST_F(CommandThreads, RunWhileSignalsArrive) {
  const Handler handler(SIGTERM, [](int) { ++signalsSeen; });
  signalsSeen = 0;
  std::atomic<bool> done{false};
  std::thread storm([&done] {
    while (!done) {
      ::kill(::getpid(), SIGTERM);
      std::this_thread::yield();
    }
  });
  EXPECT_EQ(0, wrongInThreads(kCommands / 5, runsAsItShould));
  done = true;
  storm.join();
  EXPECT_GT(signalsSeen, 0);
}

TEST_F(CommandThreads, ShareOneDescription) {
  Command command = helper({"copy"});
  command.input("text").capture(Stream::Out, 100);
  EXPECT_EQ(0, wrongInThreads(100, [&command](int) { return command.run().out.text == "text"; }));
}

// The descriptors of one command must not reach another that is started at the same moment: its
// input would then never end.
TEST_F(CommandThreads, DoNotInheritFromEachOther) {
  EXPECT_EQ(0, wrongInThreads(200, [](int n) {
              Pipe pipe;
              Command command = helper({"copy"});
              command.inputFd(pipe.readEnd()).capture(Stream::Out, 10);
              Running running = command.start();
              pipe.closeReadEnd();
              const std::string text = std::to_string(n);
              const bool written = ::write(pipe.writeEnd(), text.data(), text.size()) > 0;
              pipe.closeWriteEnd();
              return written && running.wait().out.text == text;
            }));
}

TEST_F(CommandThreads, WaitForManyAtOnce) {
  std::vector<Running> running;
  std::vector<Running *> left;
  running.reserve(100);
  for (int i = 0; i < 100; ++i) {
    running.push_back(helper({"copy"}).input(std::to_string(i)).capture(Stream::Out, 10).start());
    left.push_back(&running.back());
  }
  while (!left.empty()) {
    const std::size_t ended = Running::waitAny(left);
    left.erase(left.begin() + static_cast<std::ptrdiff_t>(ended));
  }
  for (int i = 0; i < 100; ++i) {
    EXPECT_EQ(std::to_string(i), running[static_cast<std::size_t>(i)].wait().out.text);
  }
}
