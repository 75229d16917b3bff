/// Linkage and visibility shared by all platform headers.
#pragma once

#ifdef __cplusplus
#define NORV_BEGIN_DECLS extern "C" {
#define NORV_END_DECLS }
#else
#define NORV_BEGIN_DECLS
#define NORV_END_DECLS
#endif

#define NORV_API __attribute__((visibility("default")))
