#include "service/command_streams.h"

#include "base/retry_on_eintr.h"
#include "service/failed.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

#ifndef MFD_NOEXEC_SEAL // Linux 6.3
#define MFD_NOEXEC_SEAL 0x0008U
#endif

namespace KOVA::Backup::Service {
namespace {

using Base::retryOnEintr;
using Base::UniqueFd;

constexpr char kDevNull[] = "/dev/null";

// A caller that has closed its own standard descriptors would get their numbers.
bool moveAboveStandard(UniqueFd &fd, Error &error) {
  if (fd.get() > 2) {
    return true;
  }
  UniqueFd moved(::fcntl(fd.get(), F_DUPFD_CLOEXEC, 3));
  if (!moved) {
    return failed(error, "fcntl");
  }
  fd = std::move(moved);
  return true;
}

bool openDevNull(UniqueFd &fd, Error &error) {
  fd.reset(retryOnEintr([&] { return ::open(kDevNull, O_RDWR | O_CLOEXEC); }));
  if (!fd) {
    return failed(error, "open", kDevNull);
  }
  return moveAboveStandard(fd, error);
}

bool openFile(const StreamTarget &target, UniqueFd &fd, Error &error) {
  const std::string path = target.path.front() == '/' ? target.path : "/" + target.path;
  constexpr int kFlags = O_RDWR | O_CREAT | O_APPEND | O_CLOEXEC | O_NOCTTY;
  fd.reset(retryOnEintr([&] { return ::open(path.c_str(), kFlags, 0600); }));
  if (!fd) {
    return failed(error, "open", path);
  }
  if (target.mode != 0 && ::fchmod(fd.get(), static_cast<mode_t>(target.mode)) != 0) {
    return failed(error, "fchmod", path);
  }
  return moveAboveStandard(fd, error);
}

bool writeAll(int fd, const std::string &text) {
  for (std::size_t done = 0; done < text.size();) {
    const ssize_t written =
        retryOnEintr([&] { return ::write(fd, text.data() + done, text.size() - done); });
    if (written < 0) {
      return false;
    }
    done += static_cast<std::size_t>(written);
  }
  return true;
}

// Kernels before 6.3 do not know the flag; others may be set to demand it.
UniqueFd createUnnamedFile() {
  UniqueFd fd(::memfd_create("input", MFD_CLOEXEC | MFD_ALLOW_SEALING | MFD_NOEXEC_SEAL));
  if (!fd && errno == EINVAL) {
    fd.reset(::memfd_create("input", MFD_CLOEXEC | MFD_ALLOW_SEALING));
  }
  return fd;
}

bool openText(const std::string &text, UniqueFd &fd, Error &error) {
  fd = createUnnamedFile();
  if (!fd) {
    return failed(error, "memfd_create");
  }
  if (!writeAll(fd.get(), text)) {
    return failed(error, "write");
  }
  if (::lseek(fd.get(), 0, SEEK_SET) != 0) {
    return failed(error, "lseek");
  }
  constexpr int kSeals = F_SEAL_WRITE | F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_SEAL;
  if (::fcntl(fd.get(), F_ADD_SEALS, kSeals) != 0) {
    return failed(error, "fcntl");
  }
  return moveAboveStandard(fd, error);
}

bool openTarget(const StreamTarget &target, UniqueFd &readEnd, UniqueFd &fd, Error &error) {
  if (target.readByUs()) {
    return openReadPipe(readEnd, fd, error);
  }
  const bool toFile = target.kind == StreamTarget::Kind::File && !target.path.empty();
  return toFile ? openFile(target, fd, error) : openDevNull(fd, error);
}

} // namespace

bool openPipe(UniqueFd &readEnd, UniqueFd &writeEnd, Error &error) {
  std::array<int, 2> ends{};
  if (::pipe2(ends.data(), O_CLOEXEC) != 0) {
    return failed(error, "pipe2");
  }
  readEnd.reset(ends[0]);
  writeEnd.reset(ends[1]);
  return moveAboveStandard(readEnd, error) && moveAboveStandard(writeEnd, error);
}

bool openReadPipe(UniqueFd &readEnd, UniqueFd &writeEnd, Error &error) {
  if (!openPipe(readEnd, writeEnd, error)) {
    return false;
  }
  if (::fcntl(readEnd.get(), F_SETFL, O_NONBLOCK) != 0) {
    return failed(error, "fcntl");
  }
  return true;
}

bool openStreams(const CommandPrivate &command, const Plumbing &plumbing, Streams &streams,
                 Error &error) {
  std::array<int, 3> fds = {plumbing.in, plumbing.out, -1};
  if (fds[0] < 0 && !command.textInput) {
    fds[0] = command.inputFd;
  }
  for (const std::size_t index : {0U, 1U}) {
    const StreamTarget &target = command.targets.at(index);
    if (fds.at(index + 1) < 0 && target.kind == StreamTarget::Kind::Fd) {
      fds.at(index + 1) = target.fd;
    }
  }
  for (std::size_t number = 0; number < fds.size(); ++number) {
    if (fds.at(number) < 0) {
      UniqueFd &fd = streams.ownedUntilStarted.emplace_back();
      const bool opened = number > 0          ? openTarget(command.targets.at(number - 1),
                                                           streams.readEnds.at(number - 1), fd, error)
                          : command.textInput ? openText(command.inputText, fd, error)
                                              : openDevNull(fd, error);
      if (!opened) {
        return false;
      }
      fds.at(number) = fd.get();
    }
  }
  streams.standard = fds;
  return true;
}

} // namespace KOVA::Backup::Service
