#include "b_exception.h"

#include "b_stack_walker.h"

#include <cstring>
#include <string_view>

namespace base {

namespace {
// "void base::A::f(int) const [with T = x]" -> "base::A::f". Plain names pass.
string qualifiedName(const char* function) {
    if (!function)
        return {};
    std::string_view text(function);
    // Find the '(' that opens the parameter list: the first one at template
    // depth zero.
    int depth = 0;
    std::size_t open = std::string_view::npos;
    for (std::size_t i = 0; i < text.size(); ++i) {
        char c = text[i];
        if (c == '<')
            ++depth;
        else if (c == '>')
            --depth;
        else if (c == '(' && depth == 0) {
            open = i;
            break;
        }
    }
    if (open == std::string_view::npos)
        return string(text);
    std::string_view head = text.substr(0, open);
    depth = 0;
    std::size_t start = 0;
    for (std::size_t i = head.size(); i-- > 0;) {
        char c = head[i];
        if (c == '>')
            ++depth;
        else if (c == '<')
            --depth;
        else if (c == ' ' && depth == 0) {
            start = i + 1;
            break;
        }
    }
    head = head.substr(start);
    while (!head.empty() && (head.front() == '*' || head.front() == '&'))
        head.remove_prefix(1);
    return string(head);
}
} // namespace

exception::exception(string message, const char* file, std::uint32_t line, const char* function)
    : m_line(line), m_file(file ? file : ""), m_function(qualifiedName(function)),
      m_message(std::move(message)) {
    stackWalker().appendCallStack(m_callStack, 1);
}

void exception::log(ILog& log) const {
    logFormatted(log, logSystem, logError, "{}\n    File: {} ({})\nFunction: {}", m_message, m_file,
                 m_line, m_function);
    logCallStack(log);
}

void exception::logCallStack(ILog& log) const {
    if (!m_callStack.empty())
        logFormatted(log, logSystem, logError, "Call stack:\n{}", m_callStack);
}

} // namespace base
