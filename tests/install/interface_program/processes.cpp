#include "check.h"

#include <kovabackup/exec.h>
#include <kovabackup/network.h>
#include <kovabackup/signal.h>
#include <kovabackup/subprocess.h>

#include <arpa/inet.h>
#include <list>
#include <netinet/in.h>
#include <string>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

using namespace KOVA::Backup;

namespace {

volatile sig_atomic_t handled = 0;
void countSignal(int) {
  handled = handled + 1;
}

int flagsOf(int sig) {
  struct sigaction action;
  ::sigaction(sig, nullptr, &action);
  return action.sa_flags;
}

void callSignals() {
  check(signalHandlerSet(SIGUSR1, countSignal) && ::raise(SIGUSR1) == 0 && handled == 1,
        "signalHandlerSet");
  int old = 0;
  check(signalHandlerAddFlags(SIGUSR1, SA_NODEFER, old) && (old & SA_NODEFER) == 0 &&
            (flagsOf(SIGUSR1) & SA_NODEFER) != 0,
        "signalHandlerAddFlags");
  check(signalHandlerRemoveFlags(SIGUSR1, SA_RESTART, old) && (old & SA_RESTART) != 0 &&
            (flagsOf(SIGUSR1) & SA_RESTART) == 0,
        "signalHandlerRemoveFlags");
  check(signalHandlerSetFlags(SIGUSR1, SA_RESTART) && (flagsOf(SIGUSR1) & SA_RESTART) != 0,
        "signalHandlerSetFlags");
  {
    ScopedTempSigHandler scoped;
    check(scoped.setSignalHandler(SIGUSR1, SA_NODEFER, SIG_IGN) && ::raise(SIGUSR1) == 0 &&
              handled == 1,
          "setSignalHandler");
  }
  check(::raise(SIGUSR1) == 0 && handled == 2, "~ScopedTempSigHandler");
}

bool exitedWith(int code, int status) {
  return WIFEXITED(status) && WEXITSTATUS(status) == code;
}

void callSubProcess() {
  const char *const shell = "/bin/sh";
  check(SubProcess(shell).toString() == shell, "SubProcess of a C string");
  check(SubProcess(std::string(shell)).toString() == shell, "SubProcess of a string");
  check(SubProcess(std::list<std::string>(2, "x")).toString() == "x x", "SubProcess of a list");
  SubProcess command(std::vector<std::string>(1, shell));
  command.addArg("-c");
  command.addFormatArg("test \"$%s\" = \"$1\" && exit %d", "NAME", 4);
  command.addArgList("sh", "value", nullptr);
  command.setEnv("NAME", "value");
  command.setStdOutput("/tmp/interface.out", 0600);
  command.setStdOutput(-1);
  command.setStdError("/tmp/interface.err", 0600);
  command.setStdError(-1);
  check(exitedWith(4, command.call()), "call");
  check(SubProcess("/bin/true").callBackground(true), "callBackground");
  const pid_t child = ::fork();
  if (child == 0) {
    (void)command.exec();
    ::_exit(1);
  }
  int status = 0;
  check(::waitpid(child, &status, 0) == child && exitedWith(4, status), "exec");
}

void forwarded(int, int) {}

void callUtilExec() {
  UtilExec exec;
  char shell[] = "sh";
  char option[] = "-c";
  char script[] = "exit 6";
  char *const argv[] = {shell, option, script, nullptr};
  check(exec.Execv("/bin/sh", argv, forwarded) == 6, "Execv");
  struct sigaction before;
  struct sigaction during;
  struct sigaction after;
  ::sigaction(SIGTERM, nullptr, &before);
  exec.SetSigHandler();
  ::sigaction(SIGTERM, nullptr, &during);
  exec.RestoreSigHandler();
  ::sigaction(SIGTERM, nullptr, &after);
  check(during.sa_handler != before.sa_handler, "SetSigHandler");
  check(after.sa_handler == before.sa_handler, "RestoreSigHandler");
}

void callProcessStatus() {
  check(Process::isAlive(::getpid()), "isAlive");
  check(Process::getStatus(::getpid()) == 'R', "getStatus");
  check(!Process::isZombie(::getpid()), "isZombie");
}

void callNetwork() {
  check(Net::getIpFromAddr("127.0.0.1") == "127.0.0.1", "getIpFromAddr");
  const int fd = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
  struct sockaddr_in address = {};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  socklen_t size = sizeof address;
  struct sockaddr *const general = reinterpret_cast<struct sockaddr *>(&address);
  check(::bind(fd, general, size) == 0 && ::listen(fd, 1) == 0 &&
            ::getsockname(fd, general, &size) == 0,
        "a port to connect to");
  check(Net::testIpAndPortConnect("127.0.0.1", ntohs(address.sin_port), 60) == 0,
        "testIpAndPortConnect");
  ::close(fd);
}

} // namespace

void callProcesses() {
  callSignals();
  callSubProcess();
  callUtilExec();
  callProcessStatus();
  callNetwork();
}
