#include "tests/hostile/refused_calls.h"

#include "tests/hostile/surroundings.h"

#include <cstddef>
#include <fcntl.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <sys/prctl.h>
#include <sys/syscall.h>

namespace KovaTest::Hostile {
namespace {

using Code = std::vector<struct sock_filter>;

constexpr unsigned kNumberOffset = offsetof(struct seccomp_data, nr);
// The lower half of the third argument, on a little-endian machine.
constexpr unsigned kThirdOffset = offsetof(struct seccomp_data, args) + 2 * sizeof(__u64);

struct sock_filter statement(unsigned code, unsigned value) {
  return {static_cast<__u16>(code), 0, 0, value};
}

struct sock_filter jump(unsigned code, unsigned value, unsigned yes, unsigned no) {
  return {static_cast<__u16>(code), static_cast<__u8>(yes), static_cast<__u8>(no), value};
}

struct sock_filter refusal(int error) {
  return statement(BPF_RET | BPF_K, SECCOMP_RET_ERRNO | static_cast<unsigned>(error));
}

struct sock_filter permission() {
  return statement(BPF_RET | BPF_K, SECCOMP_RET_ALLOW);
}

void install(Code code) {
  const struct sock_fprog program = {static_cast<unsigned short>(code.size()), code.data()};
  need(::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 &&
           ::prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) == 0,
       "calls cannot be refused here");
}

} // namespace

void refuseCalls(const std::vector<long> &numbers, int error) {
  Code code = {statement(BPF_LD | BPF_W | BPF_ABS, kNumberOffset)};
  for (const long number : numbers) {
    code.push_back(jump(BPF_JMP | BPF_JEQ | BPF_K, static_cast<unsigned>(number), 0, 1));
    code.push_back(refusal(error));
  }
  code.push_back(permission());
  install(code);
}

void refuseUnnamedFiles(int error) {
  constexpr unsigned kUnnamed = O_TMPFILE & ~O_DIRECTORY;
  install({statement(BPF_LD | BPF_W | BPF_ABS, kNumberOffset),
           jump(BPF_JMP | BPF_JEQ | BPF_K, SYS_openat, 0, 3),
           statement(BPF_LD | BPF_W | BPF_ABS, kThirdOffset),
           jump(BPF_JMP | BPF_JSET | BPF_K, kUnnamed, 0, 1), refusal(error), permission()});
}

} // namespace KovaTest::Hostile
