// Marks what the shared library offers to other programs.

#ifndef QUARRY_COMMON_EXPORT_H_
#define QUARRY_COMMON_EXPORT_H_

#define QUARRY_EXPORT __attribute__((visibility("default")))

#endif  // QUARRY_COMMON_EXPORT_H_
