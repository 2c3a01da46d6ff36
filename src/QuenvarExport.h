#pragma once

#if defined(_WIN32)
#if defined(QUENVAR_BUILD)
#define QUENVAR_EXPORT __declspec(dllexport)
#else
#define QUENVAR_EXPORT __declspec(dllimport)
#endif
#else
#define QUENVAR_EXPORT __attribute__((visibility("default")))
#endif
