// The sink of the library's messages, one per thread. Read library_messages.h and base/report.h
// first.
#include "library_messages.h"

#include "base/report.h"

#include <system_error>

namespace {

thread_local int last_error = 0;

void keep_error(const char * /*text*/, int error)
{
    if (error != 0) last_error = error;
}

}  // namespace

library_messages::library_messages()
{
    last_error = 0;
    img_message_sink = keep_error;
}

library_messages::~library_messages()
{
    img_message_sink = nullptr;
}

std::string library_messages::last()
{
    return last_error != 0 ? std::generic_category().message(last_error) : "";
}
