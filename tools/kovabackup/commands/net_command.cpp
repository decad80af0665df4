#include "tools/kovabackup/commands/groups.h"

#include "kovabackup/network.h"
#include "tools/kovabackup/frame/text.h"

#include <chrono>
#include <cstdint>
#include <fmt/format.h>

namespace KOVA::Backup::Tool {
namespace {

struct ProbeOptions {
  std::string target;
  std::optional<std::string> timeout;
};

struct Target {
  std::string host;
  int port;
};

constexpr int kMaxPort = 65535;
constexpr int kDefaultTimeoutSec = 5;
constexpr int kMaxTimeoutSec = 3600;

// "host:80", "192.0.2.1:80" or "[2001:db8::1]:80". Without brackets it would be unclear where an
// IPv6 address ends and the port begins.
Target parseTarget(const std::string &text) {
  const std::size_t colon = text.rfind(':');
  const bool bracketed = !text.empty() && text[0] == '[';
  std::string host = text.substr(0, colon);
  if (bracketed && host.size() > 2 && host.back() == ']') {
    host = host.substr(1, host.size() - 2);
  } else if (bracketed || host.find(':') != std::string::npos) {
    host.clear();
  }
  const auto port = colon == std::string::npos
                        ? std::nullopt
                        : parseNumber(text.substr(colon + 1), INT64_MIN, INT64_MAX);
  if (!host.empty() && port && (*port < 1 || *port > kMaxPort)) {
    throw Failure(kUsage,
                  fmt::format("'{}': port {} is not in the range 1 to {}", text, *port, kMaxPort));
  }
  if (host.empty() || !port) {
    throw Failure(
        kUsage, fmt::format("'{}' is not a valid HOST:PORT; an IPv6 address needs brackets, as in "
                            "[::1]:80",
                            text));
  }
  return {host, static_cast<int>(*port)};
}

int parseTimeout(const std::optional<std::string> &text) {
  if (!text) {
    return kDefaultTimeoutSec;
  }
  const auto seconds = parseNumber(*text, 0, kMaxTimeoutSec);
  if (!seconds) {
    throw Failure(kUsage, fmt::format("'{}' is not a valid timeout: expected an integer from 0 "
                                      "to {}",
                                      *text, kMaxTimeoutSec));
  }
  return static_cast<int>(*seconds);
}

// name is for scripts and stays the same; words are for people.
struct Outcome {
  int exitCode;
  const char *name;
  std::string words;
};

// The library reports only connected, failed or timed out. Whether a failure is the name's is found
// by looking the name up once more.
Outcome outcomeOf(int result, const Target &target, int timeoutSec) {
  if (result == 0) {
    return {kDone, "connected", "connected"};
  }
  if (result == -2) {
    return {kTimedOut, "timeout", fmt::format("no answer within {} s", timeoutSec)};
  }
  if (Net::getIpFromAddr(target.host).empty()) {
    return {kNegative, "unresolved", "the name cannot be resolved"};
  }
  return {kNegative, "refused", "refused or unreachable"};
}

int probe(Context &context, const ProbeOptions &options) {
  const Target target = parseTarget(options.target);
  const int timeoutSec = parseTimeout(options.timeout);
  // Includes the lookup of the name, which the time limit does not.
  const auto begin = std::chrono::steady_clock::now();
  const int result = Net::testIpAndPortConnect(target.host.c_str(), target.port, timeoutSec);
  const auto elapsed = std::chrono::duration_cast<std::chrono::milliseconds>(
      std::chrono::steady_clock::now() - begin);
  const Outcome outcome = outcomeOf(result, target, timeoutSec);
  context.document["host"] = jsonName(target.host);
  context.document["port"] = target.port;
  context.document["timeoutSeconds"] = timeoutSec;
  context.document["result"] = outcome.name;
  context.document["milliseconds"] = Json::Int64{elapsed.count()};
  if (context.json) {
    return outcome.exitCode;
  }
  if (outcome.exitCode != kDone) {
    context.reportError(outcome.exitCode, fmt::format("{}: {}", options.target, outcome.words));
    return outcome.exitCode;
  }
  context.out.line(fmt::format("{}: {} ({} ms)", context.out.name(options.target), outcome.words,
                               elapsed.count()));
  return kDone;
}

} // namespace

void registerNet(CommandGroup &root) {
  CommandGroup group = root.group("net", "Test network connections as the services make them");
  group.example("kovabackup net probe backup.example.com:873");
  auto options = std::make_shared<ProbeOptions>();
  group.command("probe", "Test whether a TCP port accepts connections")
      .argument(options->target, "HOST:PORT", "a name or address and a port; [::1]:80 for IPv6")
      .option(options->timeout, "--timeout", "SECONDS",
              fmt::format("time limit, 0 to {} ({})", kMaxTimeoutSec, kDefaultTimeoutSec))
      .note("Ends with 0 when connected, 3 when refused, unreachable or the name is unknown, 4 "
            "when there was no answer in time. The lookup of a name does not count towards the "
            "limit. Only the first address of a name is tried. The peer receives one zero byte.")
      .example("kovabackup net probe backup.example.com:873 --timeout 3")
      .example("kovabackup net probe '[2001:db8::1]:22'")
      .action([options](Context &c) { return probe(c, *options); });
}

} // namespace KOVA::Backup::Tool
