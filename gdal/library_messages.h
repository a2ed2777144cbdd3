// Messages of the library, which would go to the standard error stream.
#ifndef GDAL_IMGFILE_LIBRARY_MESSAGES_H
#define GDAL_IMGFILE_LIBRARY_MESSAGES_H

#include <string>

// While it lives, messages of this thread's calls are kept instead of printed.
class library_messages {
public:
    library_messages();
    ~library_messages();
    library_messages(const library_messages &) = delete;
    library_messages &operator=(const library_messages &) = delete;

    // Returns the reason that the system gave for the last failure since the object was made; empty
    // if it gave none.
    static std::string last();
};

#endif
