/* SPDX-License-Identifier: GPL-2.0-only */
/*
 * What differs between the kernels the drivers are built for (Debian's 6.1,
 * 6.12 and 7.x): only interfaces that really changed, each by the release
 * that changed it.
 */
#ifndef _TESVAR_COMPAT_H
#define _TESVAR_COMPAT_H

#include <linux/version.h>

/*
 * From 6.17 on the sysfs core hands a binary attribute's callbacks a const
 * attribute, and a group lists its binary attributes as const pointers to
 * const (6.13 to 6.16 had both forms side by side, under other names).
 */
#if LINUX_VERSION_CODE >= KERNEL_VERSION(6, 17, 0)
#define tesvar_bin_attr_const	const
#else
#define tesvar_bin_attr_const
#endif

#endif /* _TESVAR_COMPAT_H */
