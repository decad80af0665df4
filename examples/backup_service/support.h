#pragma once

/// @file What all files of the service use: failures, files that close themselves, texts for users.

#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <functional>
#include <iostream>
#include <kovabackup/option_map.h>
#include <kovabackup/service/error.h>
#include <kovabackup/string_util.h>
#include <list>
#include <memory>
#include <string>
#include <vector>

namespace fs = std::filesystem;

/// Throws std::runtime_error with the text, and the reason if there is one, unless the condition
/// holds. requireCall takes the reason from errno.
void require(bool condition, const std::string &otherwise);
void require(bool condition, const std::string &otherwise, const KOVA::Backup::Service::Error &why);
void requireCall(bool succeeded, const std::string &otherwise);

struct FileCloser {
  void operator()(std::FILE *file) const { (void)std::fclose(file); }
};
using File = std::unique_ptr<std::FILE, FileCloser>;

/// Opens a file, close-on-exec.
File openFile(const std::string &path, const char *mode);

/// How much a file holds and how much is free: "3.2 GiB written, 0 bytes free"
std::string spaceText(int fd);

/// Whether an option of a task holds a text that is not empty.
bool isSet(const KOVA::Backup::OptionMap &task, const std::string &key);

/// Example: "3.2 GiB"
std::string sizeText(std::uint64_t bytes);

/// The text on one line, with nothing in it that controls a terminal.
std::string printable(std::string text);

/// Shows progress on standard error if that is a terminal, in a line that is updated in place.
void showProgress(const std::string &text);

/// Writes a line in place of the progress.
void showMessage(const std::string &text, std::ostream &out = std::cerr);
