#include "service/file_text.h"

#include "base/open_file.h"
#include "service/failed.h"

#include <array>
#include <unistd.h>

namespace KOVA::Backup::Service {

bool readFileText(const std::string &path, std::string &text, Error &error, std::size_t enough) {
  const Base::UniqueFd file = Base::openFile(path.c_str(), O_RDONLY);
  if (!file) {
    return failed(error, "open", path);
  }
  std::string all;
  std::array<char, 16384> part; // NOLINT(cppcoreguidelines-pro-type-member-init): read fills it
  ssize_t size = 1;
  while (size > 0 && all.size() < enough) {
    size = Base::retryOnEintr([&] { return ::read(file.get(), part.data(), part.size()); });
    if (size < 0) {
      return failed(error, "read", path);
    }
    all.append(part.data(), static_cast<std::size_t>(size));
  }
  text = std::move(all);
  return true;
}

} // namespace KOVA::Backup::Service
