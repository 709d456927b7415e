// What the library's process is given in every fuzz target.

extern "C" {
// Nobody reads the log lines of millions of inputs, and sending them to the system log would be
// most of the work.
void syslog(int /*priority*/, const char* /*format*/, ...) {}
void __syslog_chk(int /*priority*/, int /*flag*/, const char* /*format*/, ...) {}

// An input frees little: a short quarantine of freed memory holds all of it, and saves half the
// time.
const char* __asan_default_options() {
  return "malloc_context_size=5:quarantine_size_mb=1:thread_local_quarantine_size_kb=64";
}
}
