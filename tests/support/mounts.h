// File systems and users that this process alone sees.

#ifndef KELODRCORE_TESTS_SUPPORT_MOUNTS_H_
#define KELODRCORE_TESTS_SUPPORT_MOUNTS_H_

// Gives this process mounts of its own; an ordinary user gets them in a user namespace, in which it
// keeps its ids. False when it may not have them.
bool EnterOwnMounts();

// Makes an ordinary user root in a user namespace, in which there is nobody else; root stays root.
// False when the user may not have one.
bool BecomeRoot();

// Whether this process may make lock files; it gets a lock directory of its own where the one of
// the machine is another user's.
bool CanLock();

#endif  // KELODRCORE_TESTS_SUPPORT_MOUNTS_H_
