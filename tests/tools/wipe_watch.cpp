// Loaded before all libraries: appends a line to the file that KOVA_WIPED names for each text of
// KOVA_WATCHED that the program itself overwrites. What its libraries overwrite does not count.
// Without <cstring>, which declares what is defined here as a function that reads nothing.

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <fcntl.h>
#include <link.h>
#include <unistd.h>

namespace {

struct Caller {
  std::uintptr_t address;
  bool inProgram;
};

// The program is the first that is reported.
int lookAt(struct dl_phdr_info *program, size_t /*size*/, void *data) {
  auto *const caller = static_cast<Caller *>(data);
  for (int i = 0; i < program->dlpi_phnum; ++i) {
    const ElfW(Phdr) &part = program->dlpi_phdr[i];
    const std::uintptr_t begin = program->dlpi_addr + part.p_vaddr;
    caller->inProgram = caller->inProgram || (part.p_type == PT_LOAD && caller->address >= begin &&
                                              caller->address - begin < part.p_memsz);
  }
  return 1; // no more
}

void note(const void *memory, size_t size, const void *returnAddress) {
  const char *const watched = std::getenv("KOVA_WATCHED");
  const char *const file = std::getenv("KOVA_WIPED");
  Caller caller{reinterpret_cast<std::uintptr_t>(returnAddress), false};
  if (watched == nullptr || file == nullptr || size != __builtin_strlen(watched) ||
      __builtin_memcmp(memory, watched, size) != 0) {
    return;
  }
  (void)::dl_iterate_phdr(&lookAt, &caller);
  const int fd =
      caller.inProgram ? ::open(file, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600) : -1;
  if (fd >= 0) {
    (void)!::write(fd, "wiped\n", 6);
    ::close(fd);
  }
}

void wipe(void *memory, size_t size) {
  volatile auto *const bytes = static_cast<volatile unsigned char *>(memory);
  for (size_t i = 0; i < size; ++i) {
    bytes[i] = 0;
  }
}

} // namespace

extern "C" __attribute__((visibility("default"))) void explicit_bzero(void *memory,
                                                                      size_t size) noexcept {
  note(memory, size, __builtin_return_address(0));
  wipe(memory, size);
}

// What an optimized program calls, by a name that only libraries may declare.
extern "C" __attribute__((visibility("default"))) void wipeChecked(void *memory, size_t size,
                                                                   size_t room) noexcept
    __asm__("__explicit_bzero_chk");

void wipeChecked(void *memory, size_t size, size_t /*room*/) noexcept {
  note(memory, size, __builtin_return_address(0));
  wipe(memory, size);
}
