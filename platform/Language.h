// What lets the public headers be read as C (C11 on) and as C++ (C++17 on). The compiler is GCC or Clang.
#pragma once

// Around the declarations of a public header, which all have C linkage. They are the only names that the
// shared library shows; everything else in it is compiled hidden.
#ifdef __cplusplus
#define LA_BEGIN_DECLARATIONS \
    extern "C" {              \
    _Pragma("GCC visibility push(default)")
#define LA_END_DECLARATIONS       \
    _Pragma("GCC visibility pop") \
    }
#else
#define LA_BEGIN_DECLARATIONS _Pragma("GCC visibility push(default)")
#define LA_END_DECLARATIONS _Pragma("GCC visibility pop")
#endif

// Behind an operation that never throws.
#ifdef __cplusplus
#define LA_NOEXCEPT noexcept
#else
#define LA_NOEXCEPT
#endif

// A constant: of its type in C++; in C, where only enumerators can stand behind `case`, of type int.
#ifdef __cplusplus
#define LA_CONSTANT(type, name, value) inline constexpr type name = value
#else
#define LA_CONSTANT(type, name, value) enum { name = value }
#endif
