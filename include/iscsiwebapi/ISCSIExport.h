/// Visibility of the library's classes: they alone are exported.
#pragma once

#define ISCSIWEBAPI_EXPORT __attribute__((visibility("default")))
