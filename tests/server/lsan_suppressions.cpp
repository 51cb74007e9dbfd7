// The embedded Java VM keeps its own allocations until the process ends;
// under LeakSanitizer they are not this library's leaks. Visible, so the
// sanitizer runtime finds the hook.
extern "C" __attribute__((visibility("default"), used)) const char* __lsan_default_suppressions() {
    return "leak:libjvm.so\n";
}
