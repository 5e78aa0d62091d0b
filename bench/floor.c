/* The floor that the program is measured against: its system calls on the sample device and nothing
 * else. Nothing is decided here: an argument makes it the start that switches the links. */
#define _GNU_SOURCE
#include <dirent.h>
#include <fcntl.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#define TIMEZONE "/var/db/timezone/"
#define CURRENT TIMEZONE "tz/2016g.1.0"
#define LATEST TIMEZONE "tz/2016h.1.0"

static const char warning[] =
    "mira_tzlinks: New update not compatible or older version: No such file or directory\n";
static char buffer[32768];
static struct stat status;

static void set_protection_class(const char* path) {
    const int directory = open(path, O_RDONLY | O_CLOEXEC);
    fcntl(directory, 64, 4);
    close(directory);
}

static void read_file(const char* path) {
    const int file = open(path, O_RDONLY);
    read(file, buffer, 8191);
    close(file);
}

/* What the walk of a directory that holds one data file comes down to. */
static void walk(const char* root) {
    stat(root, &status);
    const int start = open(".", O_RDONLY);
    fchdir(start);
    const int directory = open(root, O_RDONLY | O_NONBLOCK | O_CLOEXEC | O_DIRECTORY);
    fstat(directory, &status);
    fstat(directory, &status);
    fchdir(directory);
    getdents64(directory, buffer, sizeof buffer);
    lstat("icutz44l.dat", &status);
    getdents64(directory, buffer, sizeof buffer);
    close(directory);
    fchdir(start);
    close(start);
}

static void switch_links(void) {
    unlink(TIMEZONE "zoneinfo");
    symlink(LATEST "/zoneinfo", TIMEZONE "zoneinfo");
    unlink("/var/db/icutz");
    symlink(LATEST "/icutz", "/var/db/icutz");
    const int marker = open(TIMEZONE "needs_cleanup", O_RDWR | O_CREAT, 0666);
    fstat(marker, &status);
    close(marker);
    const int file = open(TIMEZONE "TZVersionDiffRecord", O_WRONLY | O_CREAT | O_TRUNC, 0666);
    write(file, "2016g.1.0_2016h.1.0", 19);
    close(file);
}

int main(int count, char** arguments) {
    signal(SIGPIPE, SIG_IGN);
    signal(SIGXFSZ, SIG_IGN);
    set_protection_class(TIMEZONE);
    set_protection_class(TIMEZONE "tz/");
    unlink(TIMEZONE "needs_cleanup");
    unlink("/var/db/icu");
    read_file("/usr/share/zoneinfo.default/+VERSION");
    read_file("/usr/share/icu/icutzformat.txt");
    readlink(TIMEZONE "tz_latest", buffer, 1024);
    readlink(TIMEZONE "zoneinfo", buffer, 1024);
    read_file(CURRENT "/zoneinfo/+VERSION");
    walk(CURRENT "/icutz");
    read_file(count > 1 ? LATEST "/zoneinfo/+VERSION" : CURRENT "/zoneinfo/+VERSION");
    walk(count > 1 ? LATEST "/icutz" : CURRENT "/icutz");
    if (count > 1) {
        switch_links();
    } else {
        write(STDERR_FILENO, warning, sizeof warning - 1);
    }
    readlink(TIMEZONE "localtime", buffer, 1024);
    return 0;
}
