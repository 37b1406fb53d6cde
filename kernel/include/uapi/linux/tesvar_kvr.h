/* SPDX-License-Identifier: GPL-2.0-only WITH Linux-syscall-note */
/*
 * The power-management driver's user-client call, as user space makes it.
 *
 * The driver's character device (/dev/tesvar_kvr for the reference driver)
 * takes one ioctl, TESVAR_KVR_IOC_CALL_STRUCT, which calls a method of the
 * driver by selector with a structure as input: the user-client "structure
 * method" in one system call. The only method is "setBatteryParams".
 *
 * Why an ioctl and not write(): the selector travels with the input, so a
 * caller names the method it means and an unknown one is refused as such
 * (EOPNOTSUPP) instead of being taken for a record; the input arrives whole
 * or not at all, with no short or partial writes to define; and read() stays
 * free to give the kept record back (a file opened for reading reads the
 * record kept when it was opened, whole). The record itself (29056 bytes) is
 * far larger than the 14-bit size field of an ioctl number can describe, so
 * the call carries a pointer to it.
 *
 * The structure has the same layout for 32-bit and 64-bit callers: fixed
 * width fields, the pointer carried as a 64-bit integer, naturally aligned,
 * no padding. A 32-bit process on a 64-bit kernel therefore needs no
 * translation beyond the pointer to the structure itself.
 *
 * Errors (errno of the ioctl), each meaning one thing:
 *   EOPNOTSUPP  the selector names no method of the driver
 *   EINVAL      input_size is not the size the method takes
 *   EFAULT      the structure or the input could not be read
 *   EPERM       the file was not opened for writing
 *   EBUSY       another call is in progress and the file is non-blocking
 *   EINTR       a blocking caller was killed while waiting for another call
 *   ENOMEM      the driver could not allocate the record
 *   ENOTTY      not this driver's ioctl
 * A refused call leaves the driver exactly as it was.
 */
#ifndef _UAPI_LINUX_TESVAR_KVR_H
#define _UAPI_LINUX_TESVAR_KVR_H

#include <linux/ioctl.h>
#include <linux/types.h>

/* setBatteryParams: the battery model record in, nothing out. */
#define TESVAR_KVR_SET_BATTERY_PARAMS		24
#define TESVAR_KVR_BATTERY_PARAMS_SIZE		29056

/* The SHA-1 of the record the driver holds: 20 bytes, 40 hex digits. */
#define TESVAR_KVR_PARAMS_HASH_SIZE		20

/**
 * struct tesvar_kvr_call - one structure-method call
 * @selector:	the method (TESVAR_KVR_SET_BATTERY_PARAMS)
 * @input_size:	bytes at @input; exactly what the method takes
 * @input:	user pointer to the input, as (__u64)(uintptr_t)pointer
 */
struct tesvar_kvr_call {
	__u32 selector;
	__u32 input_size;
	__aligned_u64 input;
};

#define TESVAR_KVR_IOC_MAGIC			0xBA
#define TESVAR_KVR_IOC_CALL_STRUCT \
	_IOW(TESVAR_KVR_IOC_MAGIC, 0x01, struct tesvar_kvr_call)

#endif /* _UAPI_LINUX_TESVAR_KVR_H */
