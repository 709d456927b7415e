// The ids of a program that begins as root, whoever runs it. Its own calls to read and to set ids
// stand before those of the C library, for the shared library as well: where it really is root they
// go on to the kernel, else they answer by the kernel's rules and nothing changes for the kernel.

#ifndef KELODRCORE_TESTS_UNIT_ROOT_IDS_ROOT_IDS_H_
#define KELODRCORE_TESTS_UNIT_ROOT_IDS_ROOT_IDS_H_

namespace RootIds {

// Whether the kernel knows this process as root too. Without that, programs that it starts and
// files that it makes are an ordinary user's.
bool AreReal();

// Takes away CAP_SETUID or CAP_SETGID: without it even root can switch only among its real,
// effective and saved ids.
void DropCapability(unsigned int capability);

}  // namespace RootIds

#endif  // KELODRCORE_TESTS_UNIT_ROOT_IDS_ROOT_IDS_H_
