// SPDX-License-Identifier: GPL-2.0-only
/*
 * Calls the power-management driver as a misbehaving or unprivileged client
 * would, inside the test machine, and checks that every such call is refused
 * with its own errno and leaves the driver as it was.
 *
 *   kvr_client NODE MODEL_DIR check      the table below, then the same as
 *                                        the unprivileged user 65534
 *   kvr_client NODE MODEL_DIR send FILE  one call with FILE's bytes, placed
 *                                        at 0xc0000000
 *
 * MODEL_DIR is the node's battery_model attribute directory. One line a
 * check on stdout: "VMTEST check NAME pass|fail WHAT"; exit status 1 when
 * any check failed. Built for a 32-bit user space too (i386, armhf), it makes
 * the same calls through the 64-bit kernel's compat path; the environment
 * variable VMTEST_SUFFIX, appended to every check's name, tells the runs
 * apart.
 */
#define _GNU_SOURCE
#include <errno.h>
#include <fcntl.h>
#include <grp.h>
#include <stdarg.h>
#include <stdbool.h>
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <linux/tesvar_kvr.h>

#define PARAMS_SIZE TESVAR_KVR_BATTERY_PARAMS_SIZE
#define NOBODY 65534

/*
 * Above 2 GiB: a 32-bit caller's pointer there has its top bit set, which a
 * sign-extending conversion to the call's 64-bit field, in user space or in
 * a compat layer, would spread into the upper half.
 */
#define HIGH_ADDRESS 0xc0000000UL

static int failures;

static void report(const char *name, bool pass, const char *fmt, ...)
	__attribute__((format(printf, 3, 4)));

static void report(const char *name, bool pass, const char *fmt, ...)
{
	va_list ap;

	const char *suffix = getenv("VMTEST_SUFFIX");

	printf("VMTEST check %s%s %s ", name, suffix ? suffix : "",
	       pass ? "pass" : "fail");
	va_start(ap, fmt);
	vprintf(fmt, ap);
	va_end(ap);
	putchar('\n');
	fflush(stdout);
	if (!pass)
		failures++;
}

/* The whole file, or NULL with errno set; *len is what was read. */
static char *slurp(const char *path, size_t *len)
{
	size_t cap = PARAMS_SIZE + 4096, n = 0;
	char *buf = malloc(cap);
	int fd = open(path, O_RDONLY);
	ssize_t r;

	if (!buf || fd < 0) {
		int err = errno;

		free(buf);
		if (fd >= 0)
			close(fd);
		errno = err;
		return NULL;
	}
	while (n < cap && (r = read(fd, buf + n, cap - n)) > 0)
		n += r;
	close(fd);
	*len = n;
	return buf;
}

struct snapshot {
	char *params, *hash, *uploads;
	size_t params_len, hash_len, uploads_len;
	int hash_errno;
};

static void take_snapshot(const char *dir, struct snapshot *s)
{
	char path[4096];

	snprintf(path, sizeof(path), "%s/battery_params", dir);
	s->params = slurp(path, &s->params_len);
	snprintf(path, sizeof(path), "%s/rc_params_hash", dir);
	s->hash = slurp(path, &s->hash_len);
	s->hash_errno = s->hash ? 0 : errno;
	snprintf(path, sizeof(path), "%s/uploads", dir);
	s->uploads = slurp(path, &s->uploads_len);
}

static bool same(const char *a, size_t alen, const char *b, size_t blen)
{
	if (!a || !b)
		return a == b;
	return alen == blen && memcmp(a, b, alen) == 0;
}

/* One call; the errno it ended with, 0 on success. */
static int call(const char *node, int flags, unsigned long cmd,
		uint32_t selector, uint32_t size, const void *input)
{
	struct tesvar_kvr_call c = {
		.selector = selector,
		.input_size = size,
		.input = (uintptr_t)input,
	};
	int fd = open(node, flags);
	int err = 0;

	if (fd < 0)
		return errno;
	if (ioctl(fd, cmd, &c) != 0)
		err = errno;
	close(fd);
	return err;
}

static int send_file(const char *node, const char *path)
{
	size_t len;
	char *record = slurp(path, &len);
	void *high;
	int err;

	if (!record) {
		report("record_sent_by_client", false, "%s: %s", path, strerror(errno));
		return 1;
	}
	high = mmap((void *)HIGH_ADDRESS, len, PROT_READ | PROT_WRITE,
		    MAP_PRIVATE | MAP_ANONYMOUS | MAP_FIXED_NOREPLACE, -1, 0);
	if (high == MAP_FAILED) {
		report("record_sent_by_client", false, "no mapping at %#lx: %s",
		       HIGH_ADDRESS, strerror(errno));
		free(record);
		return 1;
	}
	memcpy(high, record, len);
	free(record);
	err = call(node, O_RDWR, TESVAR_KVR_IOC_CALL_STRUCT,
		   TESVAR_KVR_SET_BATTERY_PARAMS, len, high);
	report("record_sent_by_client", err == 0, "%zu bytes at %p: %s", len,
	       high, err ? strerror(err) : "accepted");
	munmap(high, len);
	return err != 0;
}

static int check(const char *node, const char *dir)
{
	/* A record the driver must never keep: none of these calls is valid. */
	static char bogus[PARAMS_SIZE + 1];
	void *unmapped = mmap(NULL, PARAMS_SIZE, PROT_NONE,
			      MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
	const unsigned long ioc = TESVAR_KVR_IOC_CALL_STRUCT;
	const uint32_t set = TESVAR_KVR_SET_BATTERY_PARAMS;
	const struct {
		const char *name;
		int flags;
		unsigned long cmd;
		uint32_t selector, size;
		const void *input;
		int expected;
	} cases[] = {
		{ "short_record", O_RDWR, ioc, set, PARAMS_SIZE - 1, bogus, EINVAL },
		{ "long_record", O_RDWR, ioc, set, PARAMS_SIZE + 1, bogus, EINVAL },
		{ "empty_record", O_RDWR, ioc, set, 0, NULL, EINVAL },
		{ "unknown_selector", O_RDWR, ioc, 25, PARAMS_SIZE, bogus, EOPNOTSUPP },
		{ "selector_zero", O_RDWR, ioc, 0, PARAMS_SIZE, bogus, EOPNOTSUPP },
		{ "read_only_file", O_RDONLY, ioc, set, PARAMS_SIZE, bogus, EPERM },
		{ "unreadable_input", O_RDWR, ioc, set, PARAMS_SIZE, unmapped, EFAULT },
		{ "foreign_ioctl", O_RDWR, _IOW('T', 0x01, struct tesvar_kvr_call),
		  set, PARAMS_SIZE, bogus, ENOTTY },
	};
	struct snapshot before, after;
	size_t i;
	int err;

	memset(bogus, 0x5a, sizeof(bogus));
	take_snapshot(dir, &before);
	for (i = 0; i < sizeof(cases) / sizeof(cases[0]); i++) {
		err = call(node, cases[i].flags, cases[i].cmd, cases[i].selector,
			   cases[i].size, cases[i].input);
		report(cases[i].name, err == cases[i].expected,
		       "expected %s, got %s", strerrorname_np(cases[i].expected),
		       err ? strerrorname_np(err) : "success");
	}

	take_snapshot(dir, &after);
	report("record_unchanged",
	       before.params && same(before.params, before.params_len,
				     after.params, after.params_len),
	       "battery_params %zu bytes before, %zu after",
	       before.params_len, after.params_len);
	report("hash_unchanged",
	       same(before.hash, before.hash_len, after.hash, after.hash_len) &&
	       before.hash_errno == after.hash_errno,
	       "rc_params_hash %.40s", before.hash ? before.hash :
	       strerrorname_np(before.hash_errno));
	report("uploads_unchanged",
	       before.uploads && same(before.uploads, before.uploads_len,
				      after.uploads, after.uploads_len),
	       "uploads %.*s", (int)before.uploads_len,
	       before.uploads ? before.uploads : "");

	/* Last: there is no way back to root. */
	if (setgroups(0, NULL) || setgid(NOBODY) || setuid(NOBODY)) {
		report("unprivileged", false, "cannot become %d: %s", NOBODY,
		       strerror(errno));
		return 1;
	}
	err = call(node, O_RDWR, ioc, set, PARAMS_SIZE, bogus);
	report("unprivileged_open", err == EACCES, "expected EACCES, got %s",
	       err ? strerrorname_np(err) : "success");
	{
		char path[4096];
		size_t len;
		char *params;

		snprintf(path, sizeof(path), "%s/battery_params", dir);
		params = slurp(path, &len);
		err = params ? 0 : errno;
		free(params);
		report("unprivileged_record_read", err == EACCES,
		       "expected EACCES, got %s",
		       err ? strerrorname_np(err) : "success");
	}
	return failures != 0;
}

int main(int argc, char **argv)
{
	if (argc == 4 && strcmp(argv[3], "check") == 0)
		return check(argv[1], argv[2]);
	if (argc == 5 && strcmp(argv[3], "send") == 0)
		return send_file(argv[1], argv[4]);
	fprintf(stderr, "usage: %s NODE MODEL_DIR check | send FILE\n", argv[0]);
	return 2;
}
