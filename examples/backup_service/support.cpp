#include "support.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <stdexcept>
#include <sys/statvfs.h>
#include <unistd.h>

void require(bool condition, const std::string &otherwise) {
  if (!condition) {
    throw std::runtime_error(otherwise);
  }
}

void require(bool condition, const std::string &otherwise,
             const KOVA::Backup::Service::Error &why) {
  require(condition,
          otherwise + ": " + std::strerror(why.code) + " (" + why.step + " " + why.path + ")");
}

void requireCall(bool succeeded, const std::string &otherwise) {
  require(succeeded, otherwise + ": " + std::strerror(errno));
}

File openFile(const std::string &path, const char *mode) {
  File file(std::fopen(path.c_str(), (std::string(mode) + "e").c_str()));
  requireCall(file != nullptr, path);
  return file;
}

bool isSet(const KOVA::Backup::OptionMap &task, const std::string &key) {
  return !task.optString(key, "").empty();
}

std::string spaceText(int fd) {
  struct statvfs room {};
  (void)::fstatvfs(fd, &room); // nothing is free if it cannot be known
  return sizeText(std::uint64_t(::lseek(fd, 0, SEEK_END))) + " written, " +
         sizeText(std::uint64_t(room.f_bavail) * room.f_frsize) + " free";
}

std::string sizeText(std::uint64_t bytes) {
  double size = static_cast<double>(bytes);
  const char *unit = " KMGTPE";
  for (; size >= 1023.95; ++unit) { // would be printed as 1024.0
    size /= 1024;
  }
  return *unit == ' ' ? std::to_string(bytes) + " bytes"
                      : KOVA::Backup::stringf("%.1f %ciB", size, *unit);
}

std::string printable(std::string text) {
  const auto isControl = [](unsigned char c) { return c < ' ' || c == 0x7f; };
  std::replace_if(text.begin(), text.end(), isControl, '?');
  return text;
}

void showProgress(const std::string &text) {
  if (::isatty(STDERR_FILENO) == 1) {
    std::cerr << '\r' << text << "\033[K" << std::flush; // erases the rest of the line
  }
}

void showMessage(const std::string &text, std::ostream &out) {
  showProgress("");
  out << text << std::endl;
}
