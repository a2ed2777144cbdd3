// The sink of the library's messages. Read library_message.h and base/report.h first.
#include "codecs/library_message.h"

#include "failure.h"

#include "base/report.h"

namespace {

int last_error = 0;

void keep_error(const char * /*text*/, int error)
{
    if (error != 0) last_error = error;
}

}  // namespace

void library_message::collect()
{
    img_message_sink = keep_error;
}

void library_message::forget()
{
    last_error = 0;
}

std::string library_message::reason(const std::string &otherwise)
{
    return last_error != 0 ? system_text(last_error) : otherwise;
}
