#include "b_stack_walker.h"

#include <cstdlib>
#include <cstring>
#include <cxxabi.h>
#include <execinfo.h>

namespace base {

namespace {
// A backtrace_symbols line reads "module(mangled+0x12) [0xaddr]"; keep the
// function, demangled when possible, else the whole line.
void appendFrame(string& out, const char* line) {
    const char* open = std::strchr(line, '(');
    const char* plus = open ? std::strchr(open, '+') : nullptr;
    if (open && plus && plus > open + 1) {
        string mangled(open + 1, plus);
        int status = 0;
        char* demangled = abi::__cxa_demangle(mangled.c_str(), nullptr, nullptr, &status);
        out += status == 0 && demangled ? demangled : mangled.c_str();
        std::free(demangled);
    } else {
        out += line;
    }
    out += '\n';
}
} // namespace

void StackWalker::appendCallStack(string& out, int skip) const {
    if (!captureEnabled())
        return;
    void* frames[64];
    int count = backtrace(frames, 64);
    char** lines = backtrace_symbols(frames, count);
    if (!lines)
        return;
    for (int i = 1 + skip; i < count; ++i)
        appendFrame(out, lines[i]);
    std::free(lines);
}

StackWalker& stackWalker() {
    static StackWalker* walker = new StackWalker();
    return *walker;
}

} // namespace base
