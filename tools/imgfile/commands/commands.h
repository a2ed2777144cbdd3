// The commands. Each does its work and returns the exit status, 0 or 1, or throws `failure` or
// `wrong_usage`. The fields of the options are the operands and options of the command line.
#ifndef TOOL_COMMANDS_H
#define TOOL_COMMANDS_H

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

struct info_options {
    std::vector<std::string> files;
    bool json = false;
};
int run_info(const info_options &options);

struct check_options {
    std::vector<std::string> files;
};
int run_check(const check_options &options);

struct convert_options {
    std::string in, out, format, tile = "none";
    std::optional<std::string> window, bands;
    bool stretch = false, overwrite = false;
};
int run_convert(const convert_options &options);

struct preview_options {
    std::string in, out;
    std::optional<std::string> bands;
    std::int32_t size = 1024;
    bool raw = false, overwrite = false;
};
int run_preview(const preview_options &options);

struct stats_options {
    std::string in, histogram;
    bool json = false, overwrite = false;
};
int run_stats(const stats_options &options);

struct compare_options {
    std::string a, b;
};
int run_compare(const compare_options &options);

struct create_options {
    std::string out, type, tile = "none";
    std::int32_t nlines = 0, nsamps = 0, nbands = 1, nbytes = 1;
    bool pattern = false, overwrite = false;
};
int run_create(const create_options &options);

#endif
