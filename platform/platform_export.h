// Visibility of the platform library's interface: hidden by default, these names exported.
#pragma once

#if defined(NORVO_PLATFORM_BUILD)
#define QUIB_API __attribute__((visibility("default")))
#else
#define QUIB_API
#endif

#ifdef __cplusplus
#define QUIB_BEGIN_C extern "C" {
#define QUIB_END_C }
#else
#define QUIB_BEGIN_C
#define QUIB_END_C
#endif
