// What holds for every fuzzer.

// What is freed waits in the quarantine while a run or two go on, and not in memory that is new to
// the processor.
extern "C" const char* __asan_default_options() {
  return "quarantine_size_mb=4:malloc_context_size=6";
}
// What the libraries keep is told in cmake/lsan.supp for the tests; here there are few.
extern "C" const char* __lsan_default_suppressions() {
  return "leak:libfontconfig\n";
}
extern "C" const char* __lsan_default_options() {
  return "print_suppressions=0";
}
