#include "kovabackup/service/command.h"

#include "service/command_private.h"
#include "service/command_running.h"

#include <algorithm>
#include <utility>

namespace KOVA::Backup::Service {
namespace {

StreamTarget &targetOf(CommandPrivate &command, Stream stream) {
  return command.targets[stream == Stream::Out ? 0 : 1];
}

} // namespace

Command::Command(std::vector<std::string> argv) : private_(std::make_unique<CommandPrivate>()) {
  private_->args = std::move(argv);
}

Command::~Command() = default;
Command::Command(Command &&other) noexcept = default;
Command &Command::operator=(Command &&other) noexcept = default;

Command &Command::env(const std::string &name, const std::string &value) {
  private_->envs[name] = value;
  return *this;
}

Command &Command::input(std::string text) {
  private_->inputText = std::move(text);
  private_->textInput = true;
  return *this;
}

Command &Command::inputFd(int fd) {
  private_->inputFd = fd;
  private_->inputText.clear();
  private_->textInput = false;
  return *this;
}

Command &Command::capture(Stream stream, std::size_t limit) {
  StreamTarget target;
  target.kind = StreamTarget::Kind::Capture;
  target.limit = limit;
  targetOf(*private_, stream) = std::move(target);
  return *this;
}

Command &Command::lines(Stream stream, std::function<void(std::string_view)> line,
                        std::size_t longest) {
  StreamTarget target;
  target.kind = StreamTarget::Kind::Lines;
  target.limit = longest;
  target.line = std::move(line);
  targetOf(*private_, stream) = std::move(target);
  return *this;
}

Command &Command::toFd(Stream stream, int fd) {
  StreamTarget target;
  target.fd = fd;
  targetOf(*private_, stream) = std::move(target);
  return *this;
}

Command &Command::toFile(Stream stream, const std::string &path, int mode) {
  StreamTarget target;
  target.kind = StreamTarget::Kind::File;
  target.path = path;
  target.mode = mode;
  targetOf(*private_, stream) = std::move(target);
  return *this;
}

Command &Command::passFd(int fd, int as) {
  private_->passed[as] = fd;
  return *this;
}

Command &Command::limit(Millis time, Millis grace) {
  private_->limit = time;
  private_->grace = grace;
  return *this;
}

Command &Command::ownGroup(bool on) {
  private_->ownGroup = on;
  return *this;
}

Command &Command::diesWithUs(bool on) {
  private_->diesWithUs = on;
  return *this;
}

Command &Command::every(Millis interval, std::function<void()> tick) {
  private_->interval = std::max(interval, Millis(1));
  private_->tick = std::move(tick);
  return *this;
}

Command &Command::cancelledBy(Cancel &cancel) {
  private_->cancel = &cancel;
  return *this;
}

Running Command::start() const {
  auto running = std::make_unique<RunningPrivate>(*private_);
  running->start(*private_);
  return Running(std::move(running));
}

Result Command::run() const {
  return start().wait();
}

} // namespace KOVA::Backup::Service
