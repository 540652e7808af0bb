/*
 * machine_probe [DIR]: sends what this machine knows about itself to a kivd, once.
 *
 * An example of a producer. It connects to the daemon whose sockets are in DIR, or in the default
 * directory, and waits for room in the daemon's queue, so that nothing is dropped. Run it from a
 * timer to see counters move.
 *
 *   linux.stat, linux.meminfo, linux.net   counters
 *   linux.os, linux.cpu                    static data
 *   linux.process                          one event for each process: its line of /proc/PID/stat
 *   linux.log                              the last lines of a system log, one event each
 *
 * A counter holds 32 bits. So processor times are sent in seconds, interrupts and context switches
 * in thousands, sizes and traffic in kilobytes of 1024 bytes. What still doesn't fit is left out,
 * and the progress line says how many values that were.
 */
#define _DEFAULT_SOURCE
#define _POSIX_C_SOURCE 200809L

#include <ctype.h>
#include <dirent.h>
#include <errno.h>
#include <inttypes.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/klog.h>
#include <unistd.h>

#include "kiv.h"

enum { wait_ms = 10000, line_size = 8192, log_lines = 50, log_size = 65536, klog_read_all = 3 };

/* What became of one source. */
struct tally {
    kiv_handle* daemon;
    unsigned sent;
    unsigned too_large; /* beyond 32 bits, or longer than a request may be */
    int error;          /* the last other failure, a negative errno value; 0: none */
};

static void note(struct tally* tally, int result) {
    if (result == 0) {
        tally->sent++;
    } else if (result == -ERANGE || result == -EMSGSIZE) {
        tally->too_large++;
    } else {
        tally->error = result;
    }
}

/* Prints one line on a source and gives 1 when part of it was lost. */
static int conclude(const struct tally* tally, const char* source) {
    printf("%s: %u sent", source, tally->sent);
    if (tally->too_large > 0) printf(", %u too large and left out", tally->too_large);
    if (tally->error != 0) printf(", failed: %s", strerror(-tally->error));
    printf("\n");
    return tally->error != 0;
}

/* Numbers in /proc are unsigned and may have 64 bits; `divisor` brings them into a counter. */
static void send_counter(struct tally* tally, const char* package, const char* name,
                         const char* number, unsigned divisor) {
    const uint64_t value = strtoull(number, NULL, 10) / divisor;
    const int64_t counter = value > INT64_MAX ? INT64_MAX : (int64_t)value;
    note(tally, kiv_set_counter(tally->daemon, package, name, counter));
}

/* The same, the name being made of two parts. */
static void send_part_counter(struct tally* tally, const char* package, const char* whole,
                              const char* part, const char* number, unsigned divisor) {
    char name[128];
    snprintf(name, sizeof name, "%.63s.%.63s", whole, part);
    send_counter(tally, package, name, number, divisor);
}

/* Names may not hold blanks. */
static void replace_blanks(char* name) {
    for (; *name != '\0'; name++) {
        if (isspace((unsigned char)*name)) *name = '_';
    }
}

/* Cuts blanks off the end, and gives the first character that isn't one. */
static char* trim(char* text) {
    size_t size = strlen(text);
    while (size > 0 && isspace((unsigned char)text[size - 1])) text[--size] = '\0';
    while (isspace((unsigned char)*text)) text++;
    return text;
}

/* Opens a source, or notes that it can't be. */
static FILE* open_source(struct tally* tally, const char* path) {
    FILE* file = fopen(path, "r");
    if (file == NULL) tally->error = -errno;
    return file;
}

/* "cpu0 4705 150 1120 16250 ...": times in ticks, in this order. */
static void send_processor(struct tally* tally, const char* processor, char* numbers) {
    static const char* const times[] = {"user", "nice",    "system", "idle",
                                        "wait", "hardirq", "softirq"};
    const long ticks = sysconf(_SC_CLK_TCK);
    char* rest = numbers;
    for (size_t i = 0; i < sizeof times / sizeof times[0]; i++) {
        const char* number = strtok_r(NULL, " \n", &rest);
        if (number == NULL) return;
        char name[64];
        snprintf(name, sizeof name, "%s_seconds", times[i]);
        send_part_counter(tally, "linux.stat", processor, name, number,
                          ticks > 0 ? (unsigned)ticks : 100);
    }
}

static void send_stat(struct tally* tally, const char* path) {
    static const struct {
        const char* key;
        const char* name;
        unsigned divisor;
    } counters[] = {
        {"intr", "interrupts_thousands", 1000},
        {"ctxt", "context_switches_thousands", 1000},
        {"softirq", "softirqs_thousands", 1000},
        {"btime", "boot_time", 1},
        {"processes", "forks", 1},
        {"procs_running", "running_processes", 1},
        {"procs_blocked", "blocked_processes", 1},
    };
    FILE* file = open_source(tally, path);
    if (file == NULL) return;
    char* line = NULL; /* the line of all interrupts is long */
    size_t size = 0;
    while (getline(&line, &size, file) > 0) {
        char* rest = NULL;
        const char* key = strtok_r(line, " \n", &rest);
        if (key == NULL) continue;
        if (strncmp(key, "cpu", 3) == 0) {
            send_processor(tally, key, rest);
            continue;
        }
        const char* number = strtok_r(NULL, " \n", &rest);
        if (number == NULL) continue;
        for (size_t i = 0; i < sizeof counters / sizeof counters[0]; i++) {
            if (strcmp(key, counters[i].key) != 0) continue;
            send_counter(tally, "linux.stat", counters[i].name, number, counters[i].divisor);
        }
    }
    free(line);
    fclose(file);
}

/* "MemTotal:  2030916 kB"; lines without a unit count pages. */
static void send_meminfo(struct tally* tally, const char* path) {
    FILE* file = open_source(tally, path);
    if (file == NULL) return;
    char line[line_size];
    while (fgets(line, sizeof line, file) != NULL) {
        char* colon = strchr(line, ':');
        if (colon == NULL) continue;
        *colon = '\0';
        char name[128];
        const char* unit = strstr(colon + 1, " kB") != NULL ? "_kb" : "";
        snprintf(name, sizeof name, "%.100s%s", line, unit);
        send_counter(tally, "linux.meminfo", name, colon + 1, 1);
    }
    fclose(file);
}

/* "eth0: 8231 45 0 0 0 0 0 0 9122 51 ...": eight numbers received, eight sent, after two headings.
 */
static void send_net(struct tally* tally, const char* path) {
    static const struct {
        int column;
        const char* name;
        unsigned divisor;
    } counters[] = {
        {0, "received_kb", 1024}, {1, "received_packets", 1}, {2, "receive_errors", 1},
        {3, "receive_drops", 1},  {8, "sent_kb", 1024},       {9, "sent_packets", 1},
        {10, "send_errors", 1},   {11, "send_drops", 1},
    };
    FILE* file = open_source(tally, path);
    if (file == NULL) return;
    char line[line_size];
    while (fgets(line, sizeof line, file) != NULL) {
        char* colon = strrchr(line, ':'); /* the name of an alias holds one, too */
        if (colon == NULL) continue;
        *colon = '\0';
        char* interface = trim(line);
        replace_blanks(interface);
        char* rest = colon + 1;
        for (int column = 0; column < 16; column++) {
            const char* number = strtok_r(NULL, " \n", &rest);
            if (number == NULL) break;
            for (size_t i = 0; i < sizeof counters / sizeof counters[0]; i++) {
                if (column != counters[i].column) continue;
                send_part_counter(tally, "linux.net", interface, counters[i].name, number,
                                  counters[i].divisor);
            }
        }
    }
    fclose(file);
}

/* Sends one "name SEPARATOR value" line. Values may be quoted; empty ones are no static data. */
static void send_static(struct tally* tally, const char* package, char* line, char separator) {
    char* middle = strchr(line, separator);
    if (middle == NULL) return;
    *middle = '\0';
    char* name = trim(line);
    replace_blanks(name);
    char* value = trim(middle + 1);
    const size_t size = strlen(value);
    if (size >= 2 && (*value == '"' || *value == '\'') && value[size - 1] == *value) {
        value[size - 1] = '\0';
        value++;
    }
    if (*name == '\0' || *value == '\0') return;
    note(tally, kiv_set_static_data(tally->daemon, package, name, value));
}

static void send_os(struct tally* tally, const char* path) {
    FILE* file = open_source(tally, path);
    if (file == NULL) return;
    char line[line_size];
    while (fgets(line, sizeof line, file) != NULL) {
        if (*line != '#') send_static(tally, "linux.os", line, '=');
    }
    fclose(file);
}

/* The first processor only; an empty line ends it. */
static void send_cpu(struct tally* tally, const char* path) {
    FILE* file = open_source(tally, path);
    if (file == NULL) return;
    char line[line_size];
    while (fgets(line, sizeof line, file) != NULL && *line != '\n') {
        send_static(tally, "linux.cpu", line, ':');
    }
    fclose(file);
}

static void send_processes(struct tally* tally, const char* path) {
    DIR* directory = opendir(path);
    if (directory == NULL) {
        tally->error = -errno;
        return;
    }
    const struct dirent* entry;
    while ((entry = readdir(directory)) != NULL) {
        if (!isdigit((unsigned char)entry->d_name[0])) continue;
        char stat_path[512];
        snprintf(stat_path, sizeof stat_path, "%s/%s/stat", path, entry->d_name);
        FILE* file = fopen(stat_path, "r");
        if (file == NULL) continue; /* it ended meanwhile */
        char stat[line_size];
        size_t size = fread(stat, 1, sizeof stat, file);
        fclose(file);
        if (size > 0 && stat[size - 1] == '\n') size--;
        if (size == 0) continue;
        note(tally, kiv_add_event(tally->daemon, "linux.process", "stat", stat, size));
    }
    closedir(directory);
}

/* Sends the last lines of a text, which is cut to its last bytes; so the first line may be torn. */
static void send_last_lines(struct tally* tally, const char* name, const char* text, size_t size) {
    if (size > 0 && text[size - 1] == '\n') size--;
    const char* end = text + size;
    const char* start = end;
    for (unsigned lines = 0; start > text; start--) {
        if (start[-1] == '\n' && ++lines == log_lines) break;
    }
    while (start < end) {
        const char* line_end = memchr(start, '\n', (size_t)(end - start));
        if (line_end == NULL) line_end = end;
        size_t line_length = (size_t)(line_end - start);
        if (line_length > KIV_PAYLOAD_MAX) line_length = KIV_PAYLOAD_MAX;
        note(tally, kiv_add_event(tally->daemon, "linux.log", name, start, line_length));
        start = line_end + 1;
    }
}

/* Reads the last bytes of a file; 0 when it can't be read. */
static size_t read_tail(const char* path, char* text, size_t size) {
    FILE* file = fopen(path, "r");
    if (file == NULL) return 0;
    if (fseek(file, -(long)size, SEEK_END) != 0) rewind(file); /* a shorter file */
    size = fread(text, 1, size, file);
    fclose(file);
    return size;
}

/* Sends the first log that is there: a file of the system's logger, or the kernel's own. */
static void send_log(struct tally* tally, const char* path) {
    static const char* const names[] = {"syslog", "messages"};
    static char text[log_size];
    for (size_t i = 0; i < sizeof names / sizeof names[0]; i++) {
        char file_path[512];
        snprintf(file_path, sizeof file_path, "%s/%s", path, names[i]);
        const size_t size = read_tail(file_path, text, sizeof text);
        if (size == 0) continue;
        send_last_lines(tally, names[i], text, size);
        return;
    }
    const int size = klogctl(klog_read_all, text, (int)sizeof text);
    if (size > 0) send_last_lines(tally, "kernel", text, (size_t)size);
}

int main(int argc, char** argv) {
    static const struct {
        const char* path;
        void (*send)(struct tally* tally, const char* path);
    } sources[] = {
        {"/proc/stat", send_stat},    {"/proc/meminfo", send_meminfo}, {"/proc/net/dev", send_net},
        {"/etc/os-release", send_os}, {"/proc/cpuinfo", send_cpu},     {"/proc", send_processes},
        {"/var/log", send_log},
    };
    if (argc > 2 || (argc == 2 && argv[1][0] == '-')) {
        fprintf(stderr, "usage: machine_probe [DIR]\n");
        return 2;
    }
    kiv_handle* daemon = argc == 2 ? kiv_create_from_path(argv[1]) : kiv_create();
    if (daemon == NULL) {
        fprintf(stderr, "machine_probe: no daemon to be reached in %s: %s\n",
                argc == 2 ? argv[1] : "the default directory", strerror(errno));
        return 1;
    }
    kiv_set_wait(daemon, wait_ms);

    int lost = 0;
    for (size_t i = 0; i < sizeof sources / sizeof sources[0]; i++) {
        struct tally tally = {daemon, 0, 0, 0};
        sources[i].send(&tally, sources[i].path);
        lost |= conclude(&tally, sources[i].path);
    }
    kiv_destroy(daemon);
    return lost;
}
