/// @file
/// The visibility macro. The library is compiled with hidden symbols; what carries this macro is
/// its exported interface.

#ifndef KELODRCORE_EXPORT_H_
#define KELODRCORE_EXPORT_H_

/// Marks a class or function as part of the exported interface.
#define KELODR_EXPORT __attribute__((visibility("default")))

/// Takes a private member function of an exported class out of the exported interface.
#define KELODR_LOCAL __attribute__((visibility("hidden")))

#endif  // KELODRCORE_EXPORT_H_
