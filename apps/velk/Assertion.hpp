// Assertions that stay in every build: a failed one is a programming error
// of the console, never a consequence of input. It is logged and printed as
// "<program>: <source>:<line>: <function>: Assertion `<text>' failed." (the
// source relative to the project, the function as the compiler names it)
// and ends the program with SIGABRT.
#pragma once

// The condition's text is taken after macro expansion, so `p != NULL` reads
// "(p != __null)".
#define VELK_ASSERT_TEXT_(text) #text
#define VELK_ASSERT_TEXT(text) VELK_ASSERT_TEXT_(text)
#define VELK_ASSERT(condition)  \
    ((condition)                \
         ? static_cast<void>(0) \
         : ::Velk::AssertionFailed(VELK_ASSERT_TEXT((condition)), __FILE__, __LINE__, __PRETTY_FUNCTION__))

namespace Velk {

[[noreturn]] void AssertionFailed(const char* text, const char* file, int line, const char* function);

}  // namespace Velk
