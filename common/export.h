// What libfileindex shows its users. The library is built with hidden
// symbols (-fvisibility=hidden); each public header (the list in
// cmake/Install.cmake) puts its declarations between CORVLUMEX_API_BEGIN and
// CORVLUMEX_API_END, so exactly they are exported. A private header has
// neither: nothing of it leaves the library, and programs that need it link
// the library's internal static form (docs/layers.md).
#pragma once

#define CORVLUMEX_API_BEGIN _Pragma("GCC visibility push(default)")
#define CORVLUMEX_API_END _Pragma("GCC visibility pop")
