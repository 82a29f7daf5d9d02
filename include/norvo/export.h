// Visibility of libnorvo's interface: everything is hidden unless marked NORVO_API.
#pragma once

#if defined(NORVO_BUILD)
#define NORVO_API __attribute__((visibility("default")))
#else
#define NORVO_API
#endif

#ifdef __cplusplus
#define NORVO_BEGIN_C extern "C" {
#define NORVO_END_C }
#else
#define NORVO_BEGIN_C
#define NORVO_END_C
#endif
