#pragma once

/// Marks what the shared library offers; everything without the mark stays hidden inside it.
#define KDD_EXPORT __attribute__((visibility("default")))

/// Keeps a class inside a marked one out of what is offered, which it would be part of otherwise.
#define KDD_LOCAL __attribute__((visibility("hidden")))
