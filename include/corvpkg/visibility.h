// Marks the exported interface of libcorvpkg.so; everything else stays internal.
#pragma once

#define CORVPKG_API __attribute__((visibility("default")))
