// The files of the fuzz targets' machine, in memory.
#pragma once

#include <string>

namespace fuzz {

// The machine's folders, and the runner's link.
void makeFolders();

// The file's bytes, to be read and written. It is made when it is not there.
std::string &contentOf(const char *path);

// The next reads give so many bytes at most; 0 = as many as there are.
void shortenReads(size_t most);

// Nothing is open, and no temporary file is left.
void requireTidy();

} // namespace fuzz
