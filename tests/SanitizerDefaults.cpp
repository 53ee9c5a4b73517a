// Sanitizer settings compiled into every test program of the address-sanitizer build.
//
// PoCL's worker threads leave ASan unable to unmap their alternate signal stacks at exit, and the
// libraries PoCL loads and unloads leave stale dynamic TLS that crashes LeakSanitizer's scan of TLS.
// Not scanning TLS can only add leak reports, never hide one; glibc's per-thread key blocks, reachable
// only through TLS, are suppressed, as is the dynamic-loader bookkeeping of the libraries oneTBB loads and
// the per-thread dlerror message its workers leave when an optional library is missing.

extern "C" const char* __asan_default_options() {
    return "use_sigaltstack=0";
}
extern "C" const char* __lsan_default_options() {
    return "use_tls=0";
}
extern "C" const char* __lsan_default_suppressions() {
    return "leak:pthread_setspecific\nleak:add_to_global_resize\nleak:_dlerror_run\n";
}
