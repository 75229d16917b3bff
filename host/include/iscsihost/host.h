/// The host platform as its front ends see it: what the storage SDK's functions have no call for.
#pragma once

#if defined(__GNUC__)
#define ISCSI_HOST_API __attribute__((visibility("default")))
#else
#define ISCSI_HOST_API
#endif

/// Why the latest failing call of this thread into the platform failed: one line without control
/// characters and without secrets, empty when nothing failed yet. Owned by the platform, valid until
/// the thread's next failing call.
extern "C" ISCSI_HOST_API const char *iscsi_host_last_error(void);
