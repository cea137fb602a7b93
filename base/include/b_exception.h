// Exceptions of the core: programming and resource failures. Each carries its
// message, the throwing source file, line and qualified function name, and the
// call stack captured when it was built (unless capture is switched off).
#pragma once

#include "b_format.h"
#include "b_log.h"
#include "b_memory.h"

#include <cstdint>
#include <exception>

namespace base {

class exception : public std::exception {
public:
    // 'function' may be a __PRETTY_FUNCTION__ text: the qualified name is
    // taken from it ("void base::A::f(int) const" -> "base::A::f").
    exception(string message, const char* file, std::uint32_t line, const char* function);

    const char* what() const noexcept override { return m_message.c_str(); }
    virtual void log(ILog& log) const;

    const string& message() const noexcept { return m_message; }
    const char* file() const noexcept { return m_file; }
    std::uint32_t line() const noexcept { return m_line; }
    const string& function() const noexcept { return m_function; }
    const string& callStack() const noexcept { return m_callStack; }

protected:
    void logCallStack(ILog& log) const;

    std::uint32_t m_line;
    const char* m_file;
    string m_function;
    string m_message;
    string m_callStack;
};

// An exception with an extra value, logged after the message.
template <class Value>
class valued_exception : public exception {
public:
    valued_exception(string message, Value value, const char* file, std::uint32_t line,
                     const char* function)
        : exception(std::move(message), file, line, function), m_value(value) {}
    const Value& value() const noexcept { return m_value; }
    void log(ILog& log) const override {
        logFormatted(log, logSystem, logError, "{}({})\n    File: {} ({})\nFunction: {}\n",
                     m_message, m_value, m_file, m_line, m_function);
        logCallStack(log);
    }

private:
    Value m_value;
};

class invalid_argument : public valued_exception<string> {
public:
    invalid_argument(string message, const char* file, std::uint32_t line, const char* function,
                     string value = {})
        : valued_exception(std::move(message), std::move(value), file, line, function) {}
};

// A failing system call; the code is errno.
class api_exception : public valued_exception<std::int64_t> {
public:
    api_exception(string message, std::int64_t code, const char* file, std::uint32_t line,
                  const char* function)
        : valued_exception(std::move(message), code, file, line, function) {}
    std::int64_t code() const noexcept { return value(); }
};

class unsupported_interface : public exception {
public:
    unsupported_interface(const char* file, std::uint32_t line, const char* function)
        : exception("Unsupported interface.", file, line, function) {}
};

class switch_exception : public exception {
public:
    switch_exception(const char* file, std::uint32_t line, const char* function)
        : exception("Unhandled case in switch statement.", file, line, function) {}
};

class string_conversion_exception : public exception {
public:
    using exception::exception;
};

namespace fs {
class file_not_found : public exception {
public:
    using exception::exception;
};
class wrong_password : public exception {
public:
    using exception::exception;
};
} // namespace fs

} // namespace base

// Throws 'type' with a formatted message and the current source position.
#define BASE_THROW(type, ...)                                                                      \
    throw type(::base::format(__VA_ARGS__), __FILE__, __LINE__, __PRETTY_FUNCTION__)
// Same, naming the function explicitly (for messages that must name an
// interface operation rather than the implementing function).
#define BASE_THROW_IN(type, function, ...)                                                         \
    throw type(::base::format(__VA_ARGS__), __FILE__, __LINE__, function)
