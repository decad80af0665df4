#include "tests/tools/run_tool.h"

#include "base/unique_fd.h"

#include <arpa/inet.h>
#include <cstring>
#include <gmock/gmock.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using KOVA::Base::UniqueFd;
using testing::HasSubstr;

// A socket on the loopback, bound to a port of its own.
class Port {
public:
  explicit Port(int family = AF_INET)
      : fd_(::socket(family, SOCK_STREAM | SOCK_CLOEXEC, 0)), family_(family) {
    struct sockaddr_in6 six = {};
    six.sin6_family = AF_INET6;
    six.sin6_addr = in6addr_loopback;
    struct sockaddr_in four = {};
    four.sin_family = AF_INET;
    four.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    bound_ = family == AF_INET ? bindTo(&four, sizeof four) : bindTo(&six, sizeof six);
  }

  bool bound() const { return bound_; }
  void listen(int backlog) const { EXPECT_EQ(0, ::listen(fd_.get(), backlog)); }
  UniqueFd accept() const { return UniqueFd(::accept(fd_.get(), nullptr, nullptr)); }

  int number() const {
    struct sockaddr_in6 address = {};
    socklen_t size = sizeof address;
    ::getsockname(fd_.get(), reinterpret_cast<struct sockaddr *>(&address), &size);
    return ntohs(address.sin6_port); // at the same place in both families
  }
  std::string target() const {
    return (family_ == AF_INET ? "127.0.0.1:" : "[::1]:") + std::to_string(number());
  }

private:
  template <typename Address>
  bool bindTo(Address *address, socklen_t size) {
    return ::bind(fd_.get(), reinterpret_cast<struct sockaddr *>(address), size) == 0;
  }

  UniqueFd fd_;
  int family_;
  bool bound_ = false;
};

TEST(ToolNetProbe, SaysThatAPortAnswers) {
  const Port port;
  port.listen(1);
  const ToolResult result = runTool({"net", "probe", port.target()});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_THAT(result.out, testing::StartsWith(port.target() + ": connected ("));
  EXPECT_EQ("", result.messages);
}

TEST(ToolNetProbe, ReachesAnIpv6Address) {
  const Port port(AF_INET6);
  if (!port.bound()) {
    GTEST_SKIP() << "skipped: no IPv6 on the loopback";
  }
  port.listen(1);
  const Json::Value value = document(runTool({"net", "probe", "--json", port.target()}));
  EXPECT_EQ("connected", value["result"].asString());
  EXPECT_EQ("::1", value["host"].asString());
  EXPECT_EQ(port.number(), value["port"].asInt());
  EXPECT_EQ(5, value["timeoutSeconds"].asInt());
}

TEST(ToolNetProbe, SaysThatAPortRefuses) {
  const Port port; // bound, so that no other process gets it, but not listening
  const ToolResult result = runTool({"net", "probe", port.target()});
  EXPECT_EQ(3, result.exitCode) << result;
  EXPECT_EQ("", result.out);
  EXPECT_EQ("kovabackup: " + port.target() + ": refused or unreachable\n", result.messages);
  const ToolResult json = runTool({"net", "probe", port.target(), "--json"});
  EXPECT_EQ(3, json.exitCode);
  EXPECT_EQ("refused", document(json)["result"].asString());
}

// A port whose queue is full drops further requests to connect without an answer.
TEST(ToolNetProbe, SaysThatThereWasNoAnswerInTime) {
  const Port port;
  port.listen(0);
  std::vector<UniqueFd> callers;
  for (int i = 0; i < 3; ++i) {
    callers.emplace_back(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    struct sockaddr_in address = {};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    address.sin_port = htons(static_cast<std::uint16_t>(port.number()));
    (void)::connect(callers.back().get(), reinterpret_cast<struct sockaddr *>(&address),
                    sizeof address); // waits in the queue
  }
  const ToolResult result = runTool({"net", "probe", port.target(), "--timeout", "1"});
  EXPECT_EQ(4, result.exitCode) << result;
  EXPECT_EQ("kovabackup: " + port.target() + ": no answer within 1 s\n", result.messages);
  const ToolResult json = runTool({"net", "probe", port.target(), "--timeout=0", "--json"});
  EXPECT_EQ(4, json.exitCode);
  EXPECT_EQ("timeout", document(json)["result"].asString());
}

TEST(ToolNetProbe, SaysThatANameIsUnknown) {
  const std::string target =
      std::string(70, 'x') + ":80"; // the label is too long: no server is asked
  const ToolResult result = runTool({"net", "probe", target});
  EXPECT_EQ(3, result.exitCode) << result;
  EXPECT_THAT(result.messages, HasSubstr("the name cannot be resolved"));
  const ToolResult json = runTool({"net", "probe", target, "--json"});
  EXPECT_EQ(3, json.exitCode);
  EXPECT_EQ("unresolved", document(json)["result"].asString());
}

TEST(ToolNetProbe, NamesTheRangeOfPorts) {
  EXPECT_EQ("kovabackup: 'host:99999': port 99999 is not in the range 1 to 65535\n"
            "Try 'kovabackup net probe --help'.\n",
            runTool({"net", "probe", "host:99999"}).messages);
  EXPECT_THAT(runTool({"net", "probe", "[::1]:0"}).messages,
              HasSubstr("port 0 is not in the range 1 to 65535"));
}

TEST(ToolNetProbe, RefusesWrongUsage) {
  for (const char *target : {"", ":", ":80", "host", "host:", "host:0", "host:65536", "host:http",
                             "host:-1", "::1:80", "[::1]", "[]:80", "[::1:80", "h]:80x"}) {
    const ToolResult result = runTool({"net", "probe", target});
    EXPECT_EQ(2, result.exitCode) << target << result;
  }
  EXPECT_EQ(2, runTool({"net", "probe"}).exitCode);
  for (const char *timeout : {"-1", "1.5", "x", "", "3601"}) {
    EXPECT_EQ(2, runTool({"net", "probe", "127.0.0.1:9", "--timeout", timeout}).exitCode);
  }
}

} // namespace
