#pragma once

/// Marks what libfileindex.so exports; everything else stays hidden.
#define QUIVRA_EXPORT __attribute__((visibility("default")))
