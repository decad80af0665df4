#include "service/file_text.h"

#include "base/open_file.h"
#include "service/failed.h"

#include <array>
#include <unistd.h>

namespace KOVA::Backup::Service {

bool readFileText(const std::string &path, std::string &text, Error &error) {
  const Base::UniqueFd file = Base::openFile(path.c_str(), O_RDONLY);
  if (!file) {
    return failed(error, "open", path);
  }
  std::string all;
  std::array<char, 16384> part; // NOLINT(cppcoreguidelines-pro-type-member-init): read fills it
  ssize_t size = 0;
  while ((size = Base::retryOnEintr([&] { return ::read(file.get(), part.data(), part.size()); })) >
         0) {
    all.append(part.data(), static_cast<std::size_t>(size));
  }
  if (size < 0) {
    return failed(error, "read", path);
  }
  text = std::move(all);
  return true;
}

} // namespace KOVA::Backup::Service
