// The embedded Java VM keeps its own allocations until the process ends;
// under LeakSanitizer they are not this library's leaks. Visible, so the
// sanitizer runtime finds the hook. The zip libraries hold the class path's
// jars open for the VM.
extern "C" __attribute__((visibility("default"), used)) const char* __lsan_default_suppressions() {
    return "leak:libjvm.so\nleak:libzip.so\nleak:libz.so\n";
}
