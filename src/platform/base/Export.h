#pragma once

/// Marks what the shared library offers; everything without the mark stays hidden inside it.
#define KDD_EXPORT __attribute__((visibility("default")))
