// imgfile: describes, checks and converts VITec and Helava images. This file defines the command
// line; commands/commands.h lists what it calls.
//
// Exit status: 0 done; 1 the work failed, or a check or comparison found something; 2 wrong usage.
#include "commands/commands.h"
#include "failure.h"
#include "notes.h"

#include "base/report.h"

#include <CLI/CLI.hpp>
#include <array>
#include <csignal>
#include <cstdio>
#include <functional>
#include <iostream>
#include <new>

#include <fcntl.h>
#include <unistd.h>

namespace {

constexpr const char *VERSION = IMGFILE_VERSION;

// When the caller has closed a standard stream, an image could get its descriptor, and text would
// be written into the image. So the descriptor is taken by a file that cannot be written.
void take_standard_descriptors()
{
    for (int fd = STDIN_FILENO; fd <= STDERR_FILENO; ++fd)
        if (::fcntl(fd, F_GETFD) == -1) static_cast<void>(::open("/dev/null", O_RDONLY));
}

template <typename Value>
void add_operand(CLI::App *command, const char *name, Value &value, const char *help)
{
    command->add_option(name, value, help)->required()->type_name("");
}

// `placeholder` stands for the value in the help.
template <typename Value>
CLI::Option *add_option(CLI::App *command, const char *name, Value &value, const char *placeholder,
                        const char *help)
{
    return command->add_option(name, value, help)->type_name(placeholder);
}

void add_quiet(CLI::App *app)
{
    app->add_flag("--quiet", quiet, "Print no progress and no notes");
}

CLI::App *add_command(CLI::App &app, const char *name, const char *help)
{
    CLI::App *const command = app.add_subcommand(name, help);
    command->group("Commands");
    add_quiet(command);
    return command;
}

void add_output(CLI::App *command, std::string &name, bool &overwrite, const char *help)
{
    add_operand(command, "OUT", name, help);
    command->add_flag("--overwrite", overwrite, "Replace OUT if it exists");
}

CLI::App *add_info(CLI::App &app, info_options &options)
{
    CLI::App *const command = add_command(app, "info", "Describe image files");
    add_operand(command, "FILE", options.files, "Images of any format; - is standard input");
    command->add_flag("--json", options.json, "Print an array with one object for each file");
    return command;
}

CLI::App *add_check(CLI::App &app, check_options &options)
{
    CLI::App *const command = add_command(app, "check", "Check image files for errors");
    add_operand(command, "FILE", options.files, "Images of any format");
    return command;
}

CLI::App *add_convert(CLI::App &app, convert_options &options)
{
    CLI::App *const command =
        add_command(app, "convert", "Convert an image, or a part of it, to another format");
    add_operand(command, "IN", options.in, "The image; - is standard input");
    add_output(command, options.out, options.overwrite,
               "The output; its ending selects the format; - is standard output");
    add_option(command, "--format", options.format, "FORMAT",
               "vitec, helava, pgm, ppm, png or tiff (default: by the ending of OUT)")
        ->check(CLI::IsMember({"vitec", "helava", "pgm", "ppm", "png", "tiff"}, CLI::ignore_case)
                    .description(""));
    add_option(command, "--tile", options.tile, "N|NxM",
               "Tiles of N x N, or of N lines x M samples; or none (none)");
    add_option(command, "--window", options.window, "LINE,SAMP,NLINES,NSAMPS",
               "Only this part; lines and samples are counted from 0");
    add_option(command, "--band", options.bands, "N[,N...]",
               "Only these bands, in this order; counted from 0");
    command->add_flag("--stretch", options.stretch, "Stretch each band to one byte per sample");
    return command;
}

CLI::App *add_preview(CLI::App &app, preview_options &options)
{
    CLI::App *const command = add_command(app, "preview", "Write a reduced picture of an image");
    add_operand(command, "FILE", options.in, "The image; - is standard input");
    add_output(command, options.out, options.overwrite, "The picture, a PNG file");
    add_option(command, "--size", options.size, "N",
               "At most N lines and N samples, 16 to 2048 (1024)")
        ->check(CLI::Range(16, 2048).description(""));
    add_option(command, "--band", options.bands, "N[,N,N]",
               "One band, or three as red, green and blue");
    command->add_flag("--raw", options.raw,
                      "Do not stretch: show the highest 8 bits of each sample");
    return command;
}

CLI::App *add_stats(CLI::App &app, stats_options &options)
{
    CLI::App *const command = add_command(app, "stats", "Print sample statistics");
    add_operand(command, "FILE", options.in, "The image; - is standard input");
    command->add_flag("--json", options.json, "Print an object");
    add_option(command, "--histogram", options.histogram, "OUT.png",
               "Write a picture of the histograms and stretches");
    command->add_flag("--overwrite", options.overwrite, "Replace the picture if it exists");
    return command;
}

CLI::App *add_compare(CLI::App &app, compare_options &options)
{
    CLI::App *const command = add_command(app, "compare", "Compare two images sample by sample");
    add_operand(command, "A", options.a, "An image; - is standard input");
    add_operand(command, "B", options.b, "Another image, of any format");
    return command;
}

CLI::App *add_create(CLI::App &app, create_options &options)
{
    CLI::App *const command =
        add_command(app, "create", "Create an image of zeros or of a test pattern");
    add_output(command, options.out, options.overwrite, "The output; its ending selects the type");
    const auto not_negative = CLI::Range(0, INT32_MAX).description("");
    add_option(command, "--lines", options.nlines, "N", "Lines")->required()->check(not_negative);
    add_option(command, "--samples", options.nsamps, "N", "Samples per line")
        ->required()
        ->check(not_negative);
    add_option(command, "--bands", options.nbands, "N", "Bands (1)")->check(not_negative);
    add_option(command, "--bytes", options.nbytes, "N", "Bytes per sample, 1 or 2 (1)")
        ->check(CLI::Range(1, 2).description(""));
    add_option(command, "--type", options.type, "TYPE",
               "vitec or helava (default: by the ending of OUT)")
        ->check(CLI::IsMember({"vitec", "helava"}, CLI::ignore_case).description(""));
    add_option(command, "--tile", options.tile, "N|NxM",
               "Tiles of N x N, or of N lines x M samples; or none (none)");
    command->add_flag("--pattern", options.pattern, "A test pattern instead of zeros");
    return command;
}

// Prints one line to standard error; returns the status for wrong usage.
int report_wrong_usage(const CLI::App &app, const std::string &problem)
{
    std::string command = "imgfile";
    for (const CLI::App *each : app.get_subcommands()) command += " " + each->get_name();
    std::fprintf(stderr, "imgfile: %s (see %s --help)\n", in_one_line(problem).c_str(),
                 command.c_str());
    return 2;
}

void describe(CLI::App &app)
{
    app.name("imgfile");
    app.require_subcommand(1);
    app.set_version_flag("--version", text("imgfile ", VERSION), "Print the version and exit");
    app.set_help_flag("--help", "Print this help and exit");
    add_quiet(&app);
    app.get_formatter()->column_width(34);
    app.get_formatter()->label("SUBCOMMAND", "COMMAND");
    app.footer("Exit status: 0 success, 1 a failure, a finding or a difference, 2 wrong usage.\n"
               "For details: \"imgfile COMMAND --help\" and \"man imgfile-COMMAND\".");
}

// Returns the problem with arguments that cannot be parsed.
std::string parse_problem(const CLI::App &app, const CLI::ParseError &error)
{
    const std::vector<std::string> unknown = app.remaining();
    if (!app.get_subcommands().empty()) {
        const std::string lines = error.what();
        return lines.substr(0, lines.find('\n'));
    }
    if (unknown.empty()) return "a command is required";
    return (unknown[0].starts_with('-') ? "unknown option: " : "unknown command: ") + unknown[0];
}

int run(int argc, char **argv)
{
    CLI::App app(
        "Describes, checks and converts VITec and Helava images. Reads and writes PGM, PPM,\n"
        "PNG and TIFF files as well.");
    describe(app);
    info_options info;
    check_options check;
    convert_options convert;
    preview_options preview;
    stats_options stats;
    compare_options compare;
    create_options create;
    const std::array<std::pair<CLI::App *, std::function<int()>>, 7> commands{{
        {add_info(app, info), [&] { return run_info(info); }},
        {add_check(app, check), [&] { return run_check(check); }},
        {add_convert(app, convert), [&] { return run_convert(convert); }},
        {add_preview(app, preview), [&] { return run_preview(preview); }},
        {add_stats(app, stats), [&] { return run_stats(stats); }},
        {add_compare(app, compare), [&] { return run_compare(compare); }},
        {add_create(app, create), [&] { return run_create(create); }},
    }};

    try {
        app.parse(argc, argv);
    } catch (const CLI::Success &wanted) {  // help or version
        app.exit(wanted);
        return 0;
    } catch (const CLI::ParseError &error) {
        return report_wrong_usage(app, parse_problem(app, error));
    }
    try {
        for (const auto &[command, action] : commands)
            if (command->parsed()) return action();
    } catch (const wrong_usage &error) {
        return report_wrong_usage(app, error.what());
    }
    return 1;
}

int run_and_report(int argc, char **argv) noexcept
{
    try {
        return run(argc, argv);
    } catch (const std::bad_alloc &) {
        print_failure("not enough memory");
    } catch (const std::exception &error) {
        print_failure(error.what());
    }
    return 1;
}

}  // namespace

int main(int argc, char **argv)
{
    take_standard_descriptors();
    const img_message_keeper messages;
    std::signal(SIGPIPE, SIG_IGN);  // a closed pipe is an error like others
    std::signal(SIGXFSZ, SIG_IGN);
    const int status = run_and_report(argc, argv);
    if (std::fflush(stdout) == 0 && std::ferror(stdout) == 0 && std::cout.flush().good())
        return status;
    std::fprintf(stderr, "imgfile: standard output: cannot be written\n");
    return 1;
}
