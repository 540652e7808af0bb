/*
 * libkiv: sends probe data and requests to a kivd daemon on the same machine.
 *
 * Results are 0 or a negative errno value unless a function says otherwise. Nothing is ever written
 * to the terminal, and no signal is raised. A handle may be shared between threads and used on both
 * sides of a fork.
 */
#ifndef KIV_H
#define KIV_H

#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/* Length of a package and a name together, in bytes. */
#define KIV_PROBE_ID_MAX 256
/* Length of an event's payload, in bytes. */
#define KIV_PAYLOAD_MAX 30720
/* Length of a device id, in bytes; a buffer needs one more for the NUL. */
#define KIV_DEVICE_ID_MAX 40
/* Length of a configuration file that one request carries, in bytes. */
#define KIV_CONFIG_MAX 31173

/* A connection to one daemon. */
typedef struct kiv_handle kiv_handle;

/*
 * Connects to the daemon whose sockets are in `directory` (with or without a final slash), or in
 * the default directory. Gives null with errno set while no daemon listens there (ENOENT,
 * ECONNREFUSED), when the directory is null or empty (EINVAL), when its path is too long for a
 * socket address (ENAMETOOLONG) or when memory is short. The handle outlives a restart of the
 * daemon: a call that finds it gone connects anew, once. A relative directory is looked up at each
 * connecting, so it holds as long as the working directory stays.
 */
kiv_handle* kiv_create_from_path(const char* directory);
kiv_handle* kiv_create(void);

/* Closes the connection; null is fine. No other thread may still use the handle. */
void kiv_destroy(kiv_handle* handle);

/*
 * Lets producing calls wait up to `milliseconds` for room in the daemon's queue. 0, the initial
 * value, never waits: a burst outruns the short queue of a datagram socket, and what finds it full
 * is dropped.
 */
void kiv_set_wait(kiv_handle* handle, unsigned milliseconds);

/* How long queries and control requests wait for their answer: 2000 milliseconds at first. */
void kiv_set_timeout(kiv_handle* handle, unsigned milliseconds);

/* How many producing calls have been dropped because the queue was full. */
uint64_t kiv_dropped(const kiv_handle* handle);

/*
 * Producing calls: they return once the daemon has the request in its queue, never an answer.
 * Package and name are text without blanks (space, tab, CR, LF), neither may be empty.
 *
 * -EINVAL   an empty or null id or value, or one that holds a blank it must not hold
 * -EMSGSIZE the id has more than KIV_PROBE_ID_MAX bytes, the payload more than KIV_PAYLOAD_MAX, or
 *           the request as a whole is more than the daemon takes
 * -ERANGE   the counter value doesn't fit 32 bits, which is all that a request carries
 * -EAGAIN   the queue stayed full; the request is dropped and counted
 * -ECONNREFUSED, -ENOENT   the daemon is gone
 */
int kiv_add_event(kiv_handle* handle, const char* package, const char* name, const void* payload,
                  size_t payload_size);
int kiv_set_counter(kiv_handle* handle, const char* package, const char* name, int64_t value);
int kiv_inc_counter(kiv_handle* handle, const char* package, const char* name, int64_t amount);
/* The value is text and may hold blanks, but not be empty. */
int kiv_set_static_data(kiv_handle* handle, const char* package, const char* name,
                        const char* value);

/*
 * Queries and control requests: they return when the daemon has done what was asked. They travel
 * apart from the producing calls, and may overtake those that still are in the daemon's queue.
 *
 * -ETIMEDOUT               no answer in time; the request may still be carried out
 * -ECONNREFUSED, -ENOENT   no daemon
 * -ECONNRESET              the daemon ended, or hung up, before it answered
 * -EPROTO                  an answer that makes no sense
 * -EINVAL                  a negative number; an empty or null package, name or group id, or one
 *                          with a blank; an empty or null configuration
 * -EMSGSIZE                a package and name of more than KIV_PROBE_ID_MAX bytes, a configuration
 *                          of more than KIV_CONFIG_MAX; group ids beyond what the daemon takes
 * -EPERM                   the daemon refused the caller: it has neither the daemon's user id nor
 *                          the permission for private requests
 */

/* 0 when the daemon answers. */
int kiv_is_alive(kiv_handle* handle);
/* Copies the device id, NUL-terminated, to a buffer of KIV_DEVICE_ID_MAX + 1 bytes. */
int kiv_get_device_id(kiv_handle* handle, char* device_id);
/* Makes a report now. Nothing happens while data collection is off. */
int kiv_flush(kiv_handle* handle);
/* Saves counters and static data now. */
int kiv_save(kiv_handle* handle);
/*
 * Switches data collection and diagnostics on (not 0) or off (0); off deletes the diagnostics
 * files. The daemon remembers it of data collection; diagnostics are as the configuration says from
 * its next start on.
 */
int kiv_set_data_collection(kiv_handle* handle, int on);
/* Removes the report with that number (1 or more), or with 0 all of them. */
int kiv_remove_reports(kiv_handle* handle, int32_t number);
/* Group ids, which every report header carries; open to every caller. An id holds no blank. */
int kiv_set_group_id(kiv_handle* handle, const char* id);
int kiv_delete_group_id(kiv_handle* handle, const char* id);
int kiv_replace_group_id(kiv_handle* handle, const char* new_id, const char* old_id);

/*
 * 1 when an event of that package and name is wanted, 0 when it would be dropped; open to every
 * caller. A new configuration may change the answer. Whether data is collected at all does not.
 */
int kiv_is_probe_active(kiv_handle* handle, const char* package, const char* name);

/*
 * A descriptor of the part with that package and name of the configuration in force, to read from
 * its first byte. It is close-on-exec, and the caller's to close. Open to every caller.
 *
 * What it gives stays readable when the part leaves the configuration, but a configuration that
 * brings the part again is written to the same file: read it soon.
 *
 * -ENOENT   the configuration in force has no such part; that no daemon is there is told by
 *           -ECONNREFUSED alone
 * -EMFILE   the process may have no more descriptors
 */
int kiv_get_config(kiv_handle* handle, const char* package, const char* name);

/*
 * Hands the daemon a configuration file, and returns when what follows from it is through: 1 when
 * the daemon has taken it, 0 when it has not and goes on with the one before; its log says why.
 * Taking one may need a report to be made first, so slow storage may call for more time than usual
 * (kiv_set_timeout). A file that is too large for one request can be put into the daemon's
 * directory as "input/config" and announced.
 */
int kiv_install_config(kiv_handle* handle, const void* bytes, size_t size);

/*
 * Has the daemon take the file "input/config" of its directory; the results are the same. With no
 * such file there the result is 0, and the log says nothing.
 */
int kiv_announce_config(kiv_handle* handle);

/*
 * Diagnostics files are numbered from 1; the oldest have the lowest numbers and are removed as new
 * ones come. kiv_next_file gives the number of the next file behind `number`; start with 0 and go
 * on with each answer. kiv_get_file gives a descriptor of the file with that number, to read from
 * its first byte. It is close-on-exec, and the caller's to close.
 *
 * A file may be gone before it is asked for, so a number is no promise that there is one. The file
 * with the highest number may still be growing, and is replaced by a compressed one when it is
 * full: what is read from the descriptor is gzip, or is not.
 *
 * -ENOENT   no file behind that number, or with it; that no daemon is there is told by
 *           -ECONNREFUSED alone
 * -EMFILE   the process may have no more descriptors
 */
int kiv_next_file(kiv_handle* handle, int32_t number);
int kiv_get_file(kiv_handle* handle, int32_t number);

#ifdef __cplusplus
}
#endif

#endif
