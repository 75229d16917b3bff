/// How a fuzzer states what must hold.
#pragma once

#include <cstdio>
#include <cstdlib>

#define EXPECT_ALWAYS(condition)                                                                                       \
    ((condition) ? void() : (std::fprintf(stderr, "%s:%d: %s\n", __FILE__, __LINE__, #condition), std::abort()))
