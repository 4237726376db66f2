#pragma once

// Marks what the shared library offers. Everything in it is built with hidden visibility; what
// bears this mark, and nothing else, can be used by programs. C99 and C++.
#if defined(__GNUC__)
#define QV_CLIENT_API __attribute__((visibility("default")))
#else
#define QV_CLIENT_API
#endif
