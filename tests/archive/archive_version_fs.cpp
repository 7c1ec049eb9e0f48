// A small file system with an archive version, for tests and for trying things out:
//
//     archive_version_fs -f -s FOLDER
//
// It holds an empty file "file", an empty folder "folder", and "control". All three
// and the root answer the two requests. A line written to "control" sets one of
// these, and reading it gives all:
//
//     version N                the archive version
//     increase N               what the request to increase returns: 0 does it, a
//                              negative number refuses it with that error
//     get N                    the same for the request to get
//     get_after_increase N     what "get" becomes when an increase has worked
//
// A positive number does what 0 does, and is returned.

#define FUSE_USE_VERSION 35

#include <fuse.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstdio>
#include <string>

#include "archive_version.h"

namespace {

const std::string ROOT = "/";
const std::string FOLDER = "/folder";
const std::string EMPTY_FILE = "/file";
const std::string CONTROL = "/control";

ArchiveVersion archive;

/** Says to whoever has started this that the requests are answered from now on. */
void* begin(fuse_conn_info*, fuse_config*) {
    std::puts("mounted");
    std::fflush(stdout);
    return nullptr;
}

int answerRequest(const char*, unsigned request, void*, fuse_file_info*, unsigned, void* data) {
    return archive.answer(request, data);
}

int giveAttributes(const char* path, struct stat* record, fuse_file_info*) {
    *record = {};
    record->st_nlink = 1;
    if (path == ROOT || path == FOLDER) {
        record->st_mode = S_IFDIR | 0755;
    } else if (path == EMPTY_FILE || path == CONTROL) {
        record->st_mode = S_IFREG | 0644;
    } else {
        return -ENOENT;
    }
    return 0;
}

int listFolder(const char* path, void* list, fuse_fill_dir_t fill, off_t, fuse_file_info*, fuse_readdir_flags) {
    if (path == ROOT) {
        for (const std::string* entry : {&FOLDER, &EMPTY_FILE, &CONTROL}) {
            fill(list, entry->c_str() + 1, nullptr, 0, fuse_fill_dir_flags());
        }
    }
    return 0;
}

int openFile(const char*, fuse_file_info* file) {
    file->direct_io = 1; // reads what there is, whatever size was told
    return 0;
}

int truncateFile(const char*, off_t, fuse_file_info*) {
    return 0;
}

int readFile(const char* path, char* bytes, std::size_t size, off_t offset, fuse_file_info*) {
    const std::string text = path == CONTROL ? archive.settings() : std::string();
    const auto from = static_cast<std::size_t>(offset);
    return from < text.size() ? static_cast<int>(text.copy(bytes, size, from)) : 0;
}

int writeFile(const char* path, const char* bytes, std::size_t size, off_t, fuse_file_info*) {
    if (path != CONTROL) {
        return -EACCES;
    }
    return archive.set(std::string(bytes, size)) ? static_cast<int>(size) : -EINVAL;
}

} // namespace

int main(int argc, char** argv) {
    fuse_operations operations = {};
    operations.init = begin;
    operations.ioctl = answerRequest;
    operations.getattr = giveAttributes;
    operations.readdir = listFolder;
    operations.open = openFile;
    operations.truncate = truncateFile;
    operations.read = readFile;
    operations.write = writeFile;
    return fuse_main(argc, argv, &operations, nullptr);
}
