// How the address sanitizer runs unless ASAN_OPTIONS says otherwise: without the call stacks of
// allocations and with a small quarantine, which makes targets up to twice as fast. What
// scripts/fuzz shows for the repetition of a finding sets both.

extern "C" const char *__asan_default_options() {
  return "malloc_context_size=0:quarantine_size_mb=8";
}
