#ifndef KOVABACKUP_TESTS_SERVICE_REPLACED_FILES_H
#define KOVABACKUP_TESTS_SERVICE_REPLACED_FILES_H

/// @file Files in whose place the process opens others, such as those of /proc.

#include <map>
#include <string>

namespace KovaTest {

/// The path of the file that open(2) opens instead, by the path that it is given.
std::map<std::string, std::string> &replacedFiles();

} // namespace KovaTest

#endif
