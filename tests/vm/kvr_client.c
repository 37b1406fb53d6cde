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
 *   kvr_client NODE MODEL_DIR concurrent FILE
 *                                        uploaders, non-blocking callers and
 *                                        readers at once; a call held in the
 *                                        driver, a caller killed waiting
 *   kvr_client NODE MODEL_DIR faults FILE
 *                                        allocations and user copies made to
 *                                        fail one by one (a kernel with
 *                                        fault injection in debugfs)
 *   kvr_client params PARAMS_DIR SUPPLY_DIR
 *                                        the module parameters' table
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
#include <poll.h>
#include <pthread.h>
#include <signal.h>
#include <stdarg.h>
#include <stdbool.h>
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <linux/userfaultfd.h>

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

static void take_snapshot(const char *node, const char *dir,
			  struct snapshot *s)
{
	char path[4096];

	s->params = slurp(node, &s->params_len);
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
	take_snapshot(node, dir, &before);
	for (i = 0; i < sizeof(cases) / sizeof(cases[0]); i++) {
		err = call(node, cases[i].flags, cases[i].cmd, cases[i].selector,
			   cases[i].size, cases[i].input);
		report(cases[i].name, err == cases[i].expected,
		       "expected %s, got %s", strerrorname_np(cases[i].expected),
		       err ? strerrorname_np(err) : "success");
	}

	take_snapshot(node, dir, &after);
	report("record_unchanged",
	       before.params && same(before.params, before.params_len,
				     after.params, after.params_len),
	       "the node reads %zu bytes before, %zu after",
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
		char *text;

		text = slurp(node, &len);
		err = text ? 0 : errno;
		free(text);
		report("unprivileged_record_read", err == EACCES,
		       "expected EACCES, got %s",
		       err ? strerrorname_np(err) : "success");
		/* The digest and the count are anyone's to read. */
		snprintf(path, sizeof(path), "%s/rc_params_hash", dir);
		text = slurp(path, &len);
		report("unprivileged_hash_read", text && len == 41,
		       "%zu bytes", text ? len : 0);
		free(text);
	}
	return failures != 0;
}

static uint64_t now_ns(void)
{
	struct timespec ts;

	clock_gettime(CLOCK_MONOTONIC, &ts);
	return (uint64_t)ts.tv_sec * 1000000000u + ts.tv_nsec;
}

/* A small file's text without its final line feed; false when unreadable. */
static bool read_text(const char *path, char *buf, size_t size)
{
	int fd = open(path, O_RDONLY);
	ssize_t n;

	if (fd < 0)
		return false;
	n = read(fd, buf, size - 1);
	close(fd);
	if (n < 0)
		return false;
	buf[n] = '\0';
	if (n && buf[n - 1] == '\n')
		buf[n - 1] = '\0';
	return true;
}

static bool write_text(const char *path, const char *text)
{
	int fd = open(path, O_WRONLY);
	bool ok;

	if (fd < 0)
		return false;
	ok = write(fd, text, strlen(text)) == (ssize_t)strlen(text);
	close(fd);
	return ok;
}

static int upload(const char *node, int flags, const void *record)
{
	return call(node, flags, TESVAR_KVR_IOC_CALL_STRUCT,
		    TESVAR_KVR_SET_BATTERY_PARAMS, PARAMS_SIZE, record);
}

/*
 * The record the node reads, CHUNK bytes a read with PAUSE_US between
 * reads, into buf (PARAMS_SIZE + 1 bytes: a longer record shows); its
 * length, or -1 with errno set.
 */
static ssize_t read_record(const char *node, char *buf, size_t chunk,
			   unsigned int pause_us)
{
	int fd = open(node, O_RDONLY);
	size_t n = 0;
	ssize_t r = 0;

	if (fd < 0)
		return -1;
	while (n <= PARAMS_SIZE) {
		size_t want = PARAMS_SIZE + 1 - n;

		r = read(fd, buf + n, want < chunk ? want : chunk);
		if (r <= 0)
			break;
		n += r;
		if (pause_us)
			usleep(pause_us);
	}
	close(fd);
	return r < 0 ? -1 : (ssize_t)n;
}

/* The two records the concurrent case alternates, and their digests. */
struct pair {
	char a[PARAMS_SIZE], b[PARAMS_SIZE];
	char hash_a[64], hash_b[64];
};

/* 'a' or 'b' for one whole record of the pair, 0 for anything else. */
static char which_record(const struct pair *p, const char *buf, ssize_t len)
{
	if (len != PARAMS_SIZE)
		return 0;
	if (memcmp(buf, p->a, PARAMS_SIZE) == 0)
		return 'a';
	if (memcmp(buf, p->b, PARAMS_SIZE) == 0)
		return 'b';
	return 0;
}

static char which_hash(const struct pair *p, const char *hash)
{
	if (strcmp(hash, p->hash_a) == 0)
		return 'a';
	if (strcmp(hash, p->hash_b) == 0)
		return 'b';
	return 0;
}

#define UPLOADERS 4
#define UPLOADS_EACH 25
#define SERIAL_UPLOADS 100
#define READERS 4

struct call_log {
	uint64_t start, end;
	int err;
};

struct tally {
	unsigned long hashes, counts, records, bad_hash, bad_count, torn,
		paired, mismatched;
};

/* Shared by the processes of the concurrent case. */
struct shared {
	volatile int stop;
	struct call_log calls[UPLOADERS][UPLOADS_EACH];
	int uncontended;	/* EBUSY with no other call in progress */
	struct tally readers[READERS];
};

/*
 * Reads uploads, rc_params_hash, the record (root only) and uploads again
 * until told to stop. Every digest and record must be one of the pair's,
 * whole; when the count did not move, the record is the digest's.
 */
static void reader(const char *node, const char *dir, const struct pair *p,
		   bool privileged, struct tally *t, volatile int *stop)
{
	static char buf[PARAMS_SIZE + 1];
	char path_hash[4096], path_uploads[4096], text[128];
	unsigned long u1, u2;
	char h, r;

	snprintf(path_hash, sizeof(path_hash), "%s/rc_params_hash", dir);
	snprintf(path_uploads, sizeof(path_uploads), "%s/uploads", dir);
	if (!privileged && (setgroups(0, NULL) || setgid(NOBODY) ||
			    setuid(NOBODY)))
		_exit(1);
	while (!*stop) {
		if (!read_text(path_uploads, text, sizeof(text)))
			t->bad_count++;
		u1 = strtoul(text, NULL, 10);
		h = read_text(path_hash, text, sizeof(text)) ?
		    which_hash(p, text) : 0;
		t->hashes++;
		if (!h)
			t->bad_hash++;
		r = 0;
		if (privileged) {
			/* 4 KiB reads with pauses: an upload comes between. */
			r = which_record(p, buf, read_record(node, buf, 4096,
							     300));
			t->records++;
			if (!r)
				t->torn++;
		}
		if (!read_text(path_uploads, text, sizeof(text)))
			t->bad_count++;
		u2 = strtoul(text, NULL, 10);
		t->counts += 2;
		if (u2 < u1)
			t->bad_count++;
		if (privileged && u1 == u2) {
			t->paired++;
			if (r != h)
				t->mismatched++;
		}
	}
	_exit(0);
}

/* The upload the held call makes, from the thread that makes it. */
struct held {
	const char *node;
	void *input;
	int err;
};

static void *held_upload(void *arg)
{
	struct held *h = arg;

	h->err = upload(h->node, O_RDWR, h->input);
	return NULL;
}

static char proc_state(pid_t pid)
{
	char path[64], text[512], *paren;

	snprintf(path, sizeof(path), "/proc/%d/stat", (int)pid);
	if (!read_text(path, text, sizeof(text)))
		return 0;
	paren = strrchr(text, ')');
	return paren && paren[1] == ' ' ? paren[2] : 0;
}

/*
 * One call held inside the driver: its record is in memory whose first
 * page only userfaultfd provides, so the driver's copy waits there, the
 * upload lock held. Meanwhile readers must not wait, a non-blocking call
 * is a real contender's EBUSY, and a blocking caller waits until killed.
 */
static void held_call(const char *node, const char *dir, const struct pair *p)
{
	static char buf[PARAMS_SIZE + 1];
	long page = sysconf(_SC_PAGESIZE);
	size_t span = (PARAMS_SIZE + page - 1) / page * page;
	char path[4096], before[128], after[128], hash[128];
	struct uffdio_api api = { .api = UFFD_API };
	struct uffdio_register reg = { .mode = UFFDIO_REGISTER_MODE_MISSING };
	struct uffdio_copy copy = { .mode = 0 };
	struct held h = { .node = node, .err = -1 };
	struct pollfd pfd;
	struct uffd_msg msg;
	pthread_t thread;
	pid_t pid;
	int uffd, status, err, i;
	uint64_t t;
	char *area, *source, state = 0;

	snprintf(path, sizeof(path), "%s/uploads", dir);
	read_text(path, before, sizeof(before));
	uffd = syscall(SYS_userfaultfd, O_CLOEXEC);
	area = mmap(NULL, span, PROT_READ | PROT_WRITE,
		    MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
	source = mmap(NULL, span, PROT_READ | PROT_WRITE,
		      MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
	reg.range.start = (uintptr_t)area;
	reg.range.len = span;
	if (uffd < 0 || ioctl(uffd, UFFDIO_API, &api) ||
	    area == MAP_FAILED || source == MAP_FAILED ||
	    ioctl(uffd, UFFDIO_REGISTER, &reg)) {
		report("held_call", false, "userfaultfd: %s", strerror(errno));
		return;
	}
	memcpy(source, p->a, PARAMS_SIZE);
	h.input = area;
	pthread_create(&thread, NULL, held_upload, &h);

	/* The driver's copy of the record reached the missing page. */
	pfd.fd = uffd;
	pfd.events = POLLIN;
	if (poll(&pfd, 1, 20000) != 1 || read(uffd, &msg, sizeof(msg)) !=
	    sizeof(msg) || msg.event != UFFD_EVENT_PAGEFAULT) {
		report("held_call", false, "the call never reached its record");
		return;
	}
	report("held_call", true, "a call holds the driver, its copy waiting");

	/* Readers, in a child that an alarm ends if any of them waits. */
	pid = fork();
	if (pid == 0) {
		char text[128];

		alarm(10);
		snprintf(path, sizeof(path), "%s/rc_params_hash", dir);
		if (!read_text(path, text, sizeof(text)) || !which_hash(p, text))
			_exit(1);
		snprintf(path, sizeof(path), "%s/uploads", dir);
		if (!read_text(path, text, sizeof(text)) ||
		    strcmp(text, before))
			_exit(1);
		_exit(which_record(p, buf, read_record(node, buf, 4096, 0)) ?
		      0 : 1);
	}
	waitpid(pid, &status, 0);
	report("readers_do_not_wait", WIFEXITED(status) &&
	       WEXITSTATUS(status) == 0,
	       "rc_params_hash, uploads and the record read during the call: %s",
	       WIFSIGNALED(status) ? "still waiting after 10 s" :
	       WEXITSTATUS(status) ? "wrong value" : "at once");

	err = upload(node, O_RDWR | O_NONBLOCK, p->b);
	report("busy_while_held", err == EBUSY,
	       "a non-blocking call meanwhile: expected EBUSY, got %s",
	       err ? strerrorname_np(err) : "success");

	/* A blocking caller waits, killably ('D' in its stat), until killed. */
	pid = fork();
	if (pid == 0)
		_exit(upload(node, O_RDWR, p->b) ? 1 : 0);
	for (i = 0; i < 100 && state != 'D'; i++) {
		usleep(50000);
		state = proc_state(pid);
	}
	kill(pid, SIGKILL);
	t = now_ns();
	waitpid(pid, &status, 0);
	t = (now_ns() - t) / 1000000;
	read_text(path, after, sizeof(after));
	report("killed_while_waiting", state == 'D' && WIFSIGNALED(status) &&
	       WTERMSIG(status) == SIGKILL && t < 2000 && !strcmp(before, after),
	       "waiting (state %c), gone %llu ms after SIGKILL, uploads %s -> %s",
	       state ? state : '?', (unsigned long long)t, before, after);

	/* The page arrives: the held call completes with the pair's first. */
	copy.dst = (uintptr_t)area;
	copy.src = (uintptr_t)source;
	copy.len = span;
	ioctl(uffd, UFFDIO_COPY, &copy);
	pthread_join(thread, NULL);
	read_text(path, after, sizeof(after));
	snprintf(path, sizeof(path), "%s/rc_params_hash", dir);
	read_text(path, hash, sizeof(hash));
	report("held_call_completes", h.err == 0 &&
	       strtoul(after, NULL, 10) == strtoul(before, NULL, 10) + 1 &&
	       which_hash(p, hash) == 'a',
	       "%s, uploads %s -> %s", h.err ? strerrorname_np(h.err) :
	       "accepted", before, after);
	close(uffd);
	munmap(area, span);
	munmap(source, span);
}

static int concurrent(const char *node, const char *dir, const char *path)
{
	struct shared *sh = mmap(NULL, sizeof(*sh), PROT_READ | PROT_WRITE,
				 MAP_SHARED | MAP_ANONYMOUS, -1, 0);
	static struct pair p;
	char hash_path[4096], uploads_path[4096], text[128];
	unsigned long start_count, end_count, accepted = 0, busy = 0,
		busy_alone = 0, refused = 0;
	struct tally sum = { 0 };
	pid_t readers[READERS], uploaders[UPLOADERS];
	size_t len, i, j, k, m;
	char *record = slurp(path, &len);
	int err, status, readers_ok = 1;

	if (!record || len != PARAMS_SIZE || sh == MAP_FAILED) {
		report("concurrent", false, "%s: not a record", path);
		return 1;
	}
	memcpy(p.a, record, PARAMS_SIZE);
	free(record);
	/* The second record differs from the first in every byte. */
	for (i = 0; i < PARAMS_SIZE; i++)
		p.b[i] = ~p.a[i];
	snprintf(hash_path, sizeof(hash_path), "%s/rc_params_hash", dir);
	snprintf(uploads_path, sizeof(uploads_path), "%s/uploads", dir);
	if (upload(node, O_RDWR, p.b) ||
	    !read_text(hash_path, p.hash_b, sizeof(p.hash_b)) ||
	    upload(node, O_RDWR, p.a) ||
	    !read_text(hash_path, p.hash_a, sizeof(p.hash_a)) ||
	    !strcmp(p.hash_a, p.hash_b)) {
		report("concurrent", false, "the pair's digests: %s, %s",
		       p.hash_a, p.hash_b);
		return 1;
	}
	read_text(uploads_path, text, sizeof(text));
	start_count = strtoul(text, NULL, 10);

	for (k = 0; k < READERS; k++) {
		readers[k] = fork();
		if (readers[k] == 0)
			reader(node, dir, &p, k < READERS / 2, &sh->readers[k],
			       &sh->stop);
	}

	/* One non-blocking caller alone among the readers: never busy. */
	for (i = 0; i < SERIAL_UPLOADS; i++) {
		err = upload(node, O_RDWR | O_NONBLOCK, i % 2 ? p.a : p.b);
		if (err == EBUSY)
			busy_alone++;
		else if (err)
			refused++;
		else
			accepted++;
	}
	report("nonblocking_alone_never_busy", busy_alone == 0 && refused == 0,
	       "%d calls among %d readers: %lu EBUSY, %lu other errors",
	       SERIAL_UPLOADS, READERS, busy_alone, refused);

	/* Blocking and non-blocking uploaders together, the readers on. */
	for (k = 0; k < UPLOADERS; k++) {
		uploaders[k] = fork();
		if (uploaders[k] == 0) {
			int flags = O_RDWR | (k % 2 ? O_NONBLOCK : 0);

			for (m = 0; m < UPLOADS_EACH; m++) {
				struct call_log *c = &sh->calls[k][m];

				c->start = now_ns();
				c->err = upload(node, flags,
						(k + m) % 2 ? p.a : p.b);
				c->end = now_ns();
			}
			_exit(0);
		}
	}
	for (k = 0; k < UPLOADERS; k++)
		waitpid(uploaders[k], &status, 0);

	held_call(node, dir, &p);
	accepted++;	/* the held call's, checked there */

	sh->stop = 1;
	for (k = 0; k < READERS; k++) {
		waitpid(readers[k], &status, 0);
		if (!WIFEXITED(status) || WEXITSTATUS(status))
			readers_ok = 0;
	}

	/*
	 * Every EBUSY needs another uploader's call in progress at the time:
	 * one whose span overlaps the refused call's.
	 */
	refused = 0;
	for (k = 0; k < UPLOADERS; k++) {
		for (m = 0; m < UPLOADS_EACH; m++) {
			const struct call_log *c = &sh->calls[k][m];
			bool contender = false;

			if (!c->err) {
				accepted++;
				continue;
			}
			if (c->err != EBUSY || !(k % 2)) {
				refused++;
				continue;
			}
			busy++;
			for (i = 0; i < UPLOADERS && !contender; i++)
				for (j = 0; j < UPLOADS_EACH && !contender; j++)
					contender = i != k &&
						sh->calls[i][j].start < c->end &&
						sh->calls[i][j].end > c->start;
			if (!contender)
				sh->uncontended++;
		}
	}
	report("busy_only_with_contender", refused == 0 && sh->uncontended == 0,
	       "%d uploaders x %d calls: %lu EBUSY, each during another's call"
	       " (%d without), %lu other errors", UPLOADERS, UPLOADS_EACH, busy,
	       sh->uncontended, refused);

	read_text(uploads_path, text, sizeof(text));
	end_count = strtoul(text, NULL, 10);
	report("count_is_accepted_calls", end_count == start_count + accepted,
	       "uploads %lu -> %lu, %lu calls accepted", start_count, end_count,
	       accepted);

	for (k = 0; k < READERS; k++) {
		const struct tally *t = &sh->readers[k];

		sum.hashes += t->hashes;
		sum.counts += t->counts;
		sum.records += t->records;
		sum.bad_hash += t->bad_hash;
		sum.bad_count += t->bad_count;
		sum.torn += t->torn;
		sum.paired += t->paired;
		sum.mismatched += t->mismatched;
	}
	report("readers_see_whole_records", readers_ok && sum.records > 0 &&
	       sum.torn == 0 && sum.bad_hash == 0 && sum.bad_count == 0,
	       "%lu records read in 4 KiB reads, %lu torn; %lu digests, %lu not"
	       " the pair's; %lu counts, %lu wrong", sum.records, sum.torn,
	       sum.hashes, sum.bad_hash, sum.counts, sum.bad_count);
	report("record_is_its_digests", sum.paired > 0 && sum.mismatched == 0,
	       "%lu reads with no upload between: %lu record not the digest's",
	       sum.paired, sum.mismatched);
	return failures != 0;
}

#define DEBUGFS "/sys/kernel/debug"

/*
 * nth: the fail-nth file of this thread. Makes the Nth fault site of the
 * thread's next calls fail; true when a site took the fault (the count
 * reached 0), after which nothing more is injected.
 */
static void inject(int nth, unsigned int n)
{
	char text[16];

	snprintf(text, sizeof(text), "%u", n);
	pwrite(nth, text, strlen(text), 0);
}

static bool injected(int nth)
{
	char text[16] = "";
	/*
	 * The read is a fault site itself: a count not yet at 0 either shows
	 * or fails this read. Only 0 reads as 0.
	 */
	bool hit = pread(nth, text, sizeof(text) - 1, 0) > 0 && text[0] == '0';

	pwrite(nth, "0", 1, 0);
	return hit;
}

static int faults(const char *node, const char *dir, const char *path)
{
	static const char *const settings[][2] = {
		{ DEBUGFS "/failslab/ignore-gfp-wait", "N" },
		{ DEBUGFS "/failslab/verbose", "0" },
		{ DEBUGFS "/fail_page_alloc/ignore-gfp-wait", "N" },
		{ DEBUGFS "/fail_page_alloc/min-order", "0" },
		{ DEBUGFS "/fail_page_alloc/verbose", "0" },
		{ DEBUGFS "/fail_usercopy/verbose", "0" },
	};
	static const char *const everything[] = {
		DEBUGFS "/failslab", DEBUGFS "/fail_page_alloc",
	};
	static char buf[PARAMS_SIZE + 1];
	char hash_path[4096], uploads_path[4096], hash[128], count[128],
		hash2[128], count2[128], attr[4096];
	unsigned int n, sites = 0, efault = 0, enomem = 0, absorbed = 0,
		other = 0, changed = 0;
	size_t len, i;
	char *record = slurp(path, &len);
	int nth, fd, err, fail;
	bool ok = true;

	for (i = 0; i < sizeof(settings) / sizeof(settings[0]); i++)
		ok = ok && write_text(settings[i][0], settings[i][1]);
	nth = open("/proc/thread-self/fail-nth", O_RDWR);
	if (!ok || nth < 0 || !record || len != PARAMS_SIZE) {
		report("faults", false, "no fault injection: %s", strerror(errno));
		return 1;
	}
	snprintf(hash_path, sizeof(hash_path), "%s/rc_params_hash", dir);
	snprintf(uploads_path, sizeof(uploads_path), "%s/uploads", dir);

	/* Every fault site of a call, one at a time. */
	for (n = 1; n < 200; n++) {
		read_text(hash_path, hash, sizeof(hash));
		read_text(uploads_path, count, sizeof(count));
		fd = open(node, O_RDWR);
		inject(nth, n);
		err = ioctl(fd, TESVAR_KVR_IOC_CALL_STRUCT,
			    &(struct tesvar_kvr_call){
				    .selector = TESVAR_KVR_SET_BATTERY_PARAMS,
				    .input_size = PARAMS_SIZE,
				    .input = (uintptr_t)record }) ? errno : 0;
		if (!injected(nth)) {
			close(fd);
			break;
		}
		close(fd);
		sites++;
		read_text(hash_path, hash2, sizeof(hash2));
		read_text(uploads_path, count2, sizeof(count2));
		if (err == EFAULT)
			efault++;
		else if (err == ENOMEM)
			enomem++;
		else if (!err)
			absorbed++;
		else
			other++;
		/* Refused: nothing changed. Accepted: counted once. */
		if (err ? strcmp(hash, hash2) || strcmp(count, count2) :
		    strtoul(count2, NULL, 10) != strtoul(count, NULL, 10) + 1)
			changed++;
	}
	report("fault_sites", sites > 0 && efault > 0 && other == 0 &&
	       changed == 0 && n < 200,
	       "%u sites in a call: %u EFAULT, %u ENOMEM, %u absorbed (the"
	       " vmalloc fallback), %u other; %u changed what they should not",
	       sites, efault, enomem, absorbed, other, changed);

	/* Every allocation of this thread fails: the call's ENOMEM. */
	fd = open(node, O_RDWR);
	fail = open("/proc/thread-self/make-it-fail", O_WRONLY);
	for (i = 0; i < 2; i++) {
		snprintf(attr, sizeof(attr), "%s/task-filter", everything[i]);
		write_text(attr, "Y");
		snprintf(attr, sizeof(attr), "%s/probability", everything[i]);
		write_text(attr, "100");
		snprintf(attr, sizeof(attr), "%s/times", everything[i]);
		write_text(attr, "-1");
	}
	read_text(hash_path, hash, sizeof(hash));
	read_text(uploads_path, count, sizeof(count));
	pwrite(fail, "1", 1, 0);
	err = ioctl(fd, TESVAR_KVR_IOC_CALL_STRUCT,
		    &(struct tesvar_kvr_call){
			    .selector = TESVAR_KVR_SET_BATTERY_PARAMS,
			    .input_size = PARAMS_SIZE,
			    .input = (uintptr_t)record }) ? errno : 0;
	pwrite(fail, "0", 1, 0);
	for (i = 0; i < 2; i++) {
		snprintf(attr, sizeof(attr), "%s/probability", everything[i]);
		write_text(attr, "0");
		snprintf(attr, sizeof(attr), "%s/task-filter", everything[i]);
		write_text(attr, "N");
	}
	close(fail);
	close(fd);
	read_text(hash_path, hash2, sizeof(hash2));
	read_text(uploads_path, count2, sizeof(count2));
	report("no_memory", err == ENOMEM && !strcmp(hash, hash2) &&
	       !strcmp(count, count2),
	       "every allocation failing: expected ENOMEM, got %s; uploads %s -> %s",
	       err ? strerrorname_np(err) : "success", count, count2);

	/* The record read back: a failed copy, then the whole record. */
	sites = 0;
	other = 0;
	changed = 0;
	for (n = 1; n < 50; n++) {
		ssize_t r;

		fd = open(node, O_RDONLY);
		inject(nth, n);
		r = read(fd, buf, sizeof(buf));
		err = r < 0 ? errno : 0;
		if (!injected(nth)) {
			close(fd);
			break;
		}
		sites++;
		if (err != EFAULT)
			other++;
		len = 0;
		while ((r = read(fd, buf + len, sizeof(buf) - len)) > 0)
			len += r;
		if (len != PARAMS_SIZE || memcmp(buf, record, PARAMS_SIZE))
			changed++;
		close(fd);
	}
	report("read_fault", sites > 0 && other == 0 && changed == 0,
	       "%u sites in a read: each EFAULT (%u not), then the whole record"
	       " (%u not)", sites, other, changed);

	/*
	 * Opening the node, every allocation on the way: the path's and the
	 * file's (whose errors are the VFS's own) and the driver's. Each open
	 * fails, or succeeds when the failure was absorbed; kmemleak then
	 * finds nothing left behind.
	 */
	sites = 0;
	enomem = 0;
	other = 0;
	for (n = 1; n < 100; n++) {
		inject(nth, n);
		fd = open(node, O_RDONLY);
		err = fd < 0 ? errno : 0;
		if (!injected(nth)) {
			if (fd >= 0)
				close(fd);
			break;
		}
		if (fd >= 0)
			close(fd);
		sites++;
		if (err == ENOMEM)
			enomem++;
		else if (err)
			other = err;
	}
	report("open_fault", sites > 0 && enomem > 0 && n < 100,
	       "%u sites in an open: %u ENOMEM, another error %s", sites,
	       enomem, other ? strerrorname_np(other) : "none");
	free(record);
	close(nth);
	return failures != 0;
}

/* Bytes as C would write them, for the table's lines. */
static const char *escaped(const char *s, char *out, size_t size)
{
	size_t n = 0;

	for (; *s && n < size - 5; s++) {
		unsigned char c = *s;

		if (c >= 0x20 && c < 0x7f && c != '\\')
			out[n++] = c;
		else
			n += snprintf(out + n, size - n, "\\x%02x", c);
	}
	out[n] = '\0';
	return out;
}

/* The value of VAR= in a uevent file, or "" when absent. */
static void uevent_value(const char *supply, const char *var, char *buf,
			 size_t size)
{
	char path[4096], text[4096], *line;
	size_t len = strlen(var);

	buf[0] = '\0';
	snprintf(path, sizeof(path), "%s/uevent", supply);
	if (!read_text(path, text, sizeof(text)))
		return;
	for (line = strtok(text, "\n"); line; line = strtok(NULL, "\n"))
		if (!strncmp(line, var, len) && line[len] == '=')
			snprintf(buf, size, "%s", line + len + 1);
}

static int params(const char *dir, const char *supply)
{
	static const struct {
		const char *name, *param, *input;
		int expected;
		const char *stored;	/* when accepted */
	} rows[] = {
		{ "chem_decimal", "chem_id", "5640\n", 0, "5640" },
		{ "chem_no_line_feed", "chem_id", "6439", 0, "6439" },
		{ "chem_leading_zero_decimal", "chem_id", "010", 0, "10" },
		{ "chem_hex", "chem_id", "0x2168\n", 0, "8552" },
		{ "chem_hex_upper_digits", "chem_id", "0x00FF", 0, "255" },
		{ "chem_largest", "chem_id", "4294967295\n", 0, "4294967295" },
		{ "chem_zero", "chem_id", "0", 0, "0" },
		{ "chem_too_large", "chem_id", "4294967296", EINVAL, NULL },
		{ "chem_hex_too_large", "chem_id", "0x100000000", EINVAL, NULL },
		{ "chem_negative", "chem_id", "-1", EINVAL, NULL },
		{ "chem_plus", "chem_id", "+5", EINVAL, NULL },
		{ "chem_leading_space", "chem_id", " 5", EINVAL, NULL },
		{ "chem_trailing_space", "chem_id", "5 ", EINVAL, NULL },
		{ "chem_two_line_feeds", "chem_id", "5\n\n", EINVAL, NULL },
		{ "chem_line_feed_only", "chem_id", "\n", EINVAL, NULL },
		{ "chem_bare_prefix", "chem_id", "0x", EINVAL, NULL },
		{ "chem_upper_prefix", "chem_id", "0X10", EINVAL, NULL },
		{ "chem_double_prefix", "chem_id", "0x0x10", EINVAL, NULL },
		{ "chem_hex_digit_in_decimal", "chem_id", "12a", EINVAL, NULL },
		{ "chem_octal_prefix", "chem_id", "0o17", EINVAL, NULL },
		{ "serial_plain", "serial_number", "F5D2470A1B2C3D48E\n", 0,
		  "F5D2470A1B2C3D48E" },
		{ "serial_31_bytes", "serial_number",
		  "ABCDEFGHIJKLMNOPQRSTUVWXYZ01234\n", 0,
		  "ABCDEFGHIJKLMNOPQRSTUVWXYZ01234" },
		{ "serial_32_bytes", "serial_number",
		  "ABCDEFGHIJKLMNOPQRSTUVWXYZ012345", EINVAL, NULL },
		{ "serial_space_and_tilde", "serial_number", " S/N: 12~34 ", 0,
		  " S/N: 12~34 " },
		{ "serial_empty", "serial_number", "\n", 0, "" },
		{ "serial_inner_line_feed", "serial_number", "ABC\nDEF", EINVAL,
		  NULL },
		{ "serial_two_line_feeds", "serial_number", "ABC\n\n", EINVAL,
		  NULL },
		{ "serial_carriage_return", "serial_number", "ABC\r", EINVAL,
		  NULL },
		{ "serial_escape", "serial_number", "\x1b[31mRED", EINVAL, NULL },
		{ "serial_tab", "serial_number", "A\tB", EINVAL, NULL },
		{ "serial_delete", "serial_number", "AB\x7f", EINVAL, NULL },
		{ "serial_utf8", "serial_number", "caf\xc3\xa9", EINVAL, NULL },
		{ "serial_not_utf8", "serial_number", "\xff\xfe", EINVAL, NULL },
	};
	char path[4096], shown[4096], before[256], after[256], published[256];
	char input_text[256], after_text[256];
	char chem0[256] = "", serial0[256] = "";
	size_t i;
	int fd, err;

	snprintf(path, sizeof(path), "%s/chem_id", dir);
	read_text(path, chem0, sizeof(chem0));
	snprintf(path, sizeof(path), "%s/serial_number", dir);
	read_text(path, serial0, sizeof(serial0));
	for (i = 0; i < sizeof(rows) / sizeof(rows[0]); i++) {
		bool chem = !strcmp(rows[i].param, "chem_id");
		const char *want;

		snprintf(path, sizeof(path), "%s/%s", dir, rows[i].param);
		read_text(path, before, sizeof(before));
		fd = open(path, O_WRONLY);
		err = fd < 0 ? errno :
		      write(fd, rows[i].input, strlen(rows[i].input)) ==
		      (ssize_t)strlen(rows[i].input) ? 0 : errno;
		if (fd >= 0)
			close(fd);
		read_text(path, after, sizeof(after));
		/* What the battery shows: the supply's file, its uevent. */
		if (chem) {
			snprintf(shown, sizeof(shown), "%s/algo_chem_id", supply);
			read_text(shown, published, sizeof(published));
		} else {
			uevent_value(supply, "POWER_SUPPLY_SERIAL_NUMBER",
				     published, sizeof(published));
		}
		want = rows[i].expected ? before : rows[i].stored;
		report(rows[i].name, err == rows[i].expected &&
		       !strcmp(after, want) && !strcmp(published, want),
		       "\"%s\": expected %s, got %s; %s \"%s\", the battery \"%s\"",
		       escaped(rows[i].input, input_text, sizeof(input_text)),
		       rows[i].expected ? strerrorname_np(rows[i].expected) :
		       "success", err ? strerrorname_np(err) : "success",
		       rows[i].param, escaped(after, after_text, sizeof(after_text)),
		       published);
	}
	snprintf(path, sizeof(path), "%s/chem_id", dir);
	write_text(path, chem0);
	snprintf(path, sizeof(path), "%s/serial_number", dir);
	write_text(path, serial0);
	return failures != 0;
}

int main(int argc, char **argv)
{
	if (argc == 4 && strcmp(argv[3], "check") == 0)
		return check(argv[1], argv[2]);
	if (argc == 5 && strcmp(argv[3], "send") == 0)
		return send_file(argv[1], argv[4]);
	if (argc == 5 && strcmp(argv[3], "concurrent") == 0)
		return concurrent(argv[1], argv[2], argv[4]);
	if (argc == 5 && strcmp(argv[3], "faults") == 0)
		return faults(argv[1], argv[2], argv[4]);
	if (argc == 4 && strcmp(argv[1], "params") == 0)
		return params(argv[2], argv[3]);
	fprintf(stderr, "usage: %s NODE MODEL_DIR check | send FILE | concurrent FILE | faults FILE\n"
		"       %s params PARAMS_DIR SUPPLY_DIR\n", argv[0], argv[0]);
	return 2;
}
