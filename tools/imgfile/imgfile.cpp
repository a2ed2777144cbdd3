// imgfile: looks at VITec and Helava images, checks them, and moves them to and from other formats.
//
// Exit status: 0 done; 1 the work failed, or a check or comparison found something; 2 wrong usage.
#include "commands.h"
#include "failure.h"
#include "walk.h"

#include <CLI/CLI.hpp>
#include <array>
#include <csignal>
#include <cstdio>
#include <functional>
#include <new>

#include <fcntl.h>
#include <unistd.h>

namespace {

constexpr const char *VERSION = IMGFILE_VERSION;

// A host that has closed a standard stream must not find its text in an image: the descriptor is
// taken, by something that cannot be written.
void take_standard_descriptors()
{
    for (int fd = STDIN_FILENO; fd <= STDERR_FILENO; ++fd)
        if (::fcntl(fd, F_GETFD) == -1) static_cast<void>(::open("/dev/null", O_RDONLY));
}

template <typename Value>
void add_operand(CLI::App *command, const char *name, Value &value, const char *what)
{
    command->add_option(name, value, what)->required()->type_name("");
}

// `kind` stands for the value in the help.
template <typename Value>
CLI::Option *add_option(CLI::App *command, const char *name, Value &value, const char *kind,
                        const char *what)
{
    return command->add_option(name, value, what)->type_name(kind);
}

void add_quiet(CLI::App *app)
{
    app->add_flag("--quiet", quiet, "Print no progress and no notes");
}

CLI::App *add_command(CLI::App &app, const char *name, const char *what)
{
    CLI::App *const command = app.add_subcommand(name, what);
    command->group("Commands");
    add_quiet(command);
    return command;
}

void add_output(CLI::App *command, std::string &name, bool &overwrite, const char *what)
{
    add_operand(command, "OUT", name, what);
    command->add_flag("--overwrite", overwrite, "Replace OUT if it exists");
}

CLI::App *add_info(CLI::App &app, info_options &asked)
{
    CLI::App *const command = add_command(app, "info", "Tell what image files are");
    add_operand(command, "FILE", asked.files, "Images of any format; - is standard input");
    command->add_flag("--json", asked.json, "Print an array with one object for each file");
    return command;
}

CLI::App *add_check(CLI::App &app, check_options &asked)
{
    CLI::App *const command =
        add_command(app, "check", "Look for all that can be wrong with image files");
    add_operand(command, "FILE", asked.files, "Images of any format");
    return command;
}

CLI::App *add_convert(CLI::App &app, convert_options &asked)
{
    CLI::App *const command =
        add_command(app, "convert", "Write an image, or a part of it, in another format");
    add_operand(command, "IN", asked.in, "The image; - is standard input");
    add_output(command, asked.out, asked.overwrite,
               "What to write; its ending tells the format; - is standard output");
    add_option(command, "--format", asked.format, "FORMAT",
               "vitec, helava, pgm, ppm, png or tiff, whatever OUT ends in")
        ->check(CLI::IsMember({"vitec", "helava", "pgm", "ppm", "png", "tiff"}, CLI::ignore_case)
                    .description(""));
    add_option(command, "--tile", asked.tile, "N|NxM",
               "Store in tiles of N x N, or N lines x M samples; or none");
    add_option(command, "--window", asked.window, "LINE,SAMP,NLINES,NSAMPS",
               "Only this part; lines and samples count from 0");
    add_option(command, "--band", asked.bands, "N[,N...]",
               "Only these bands, in this order; they count from 0");
    command->add_flag("--stretch", asked.stretch,
                      "Stretch to one byte per sample, all by one histogram");
    return command;
}

CLI::App *add_preview(CLI::App &app, preview_options &asked)
{
    CLI::App *const command = add_command(app, "preview", "Make a picture for people to look at");
    add_operand(command, "FILE", asked.in, "The image; - is standard input");
    add_output(command, asked.out, asked.overwrite, "The picture, a PNG file");
    add_option(command, "--size", asked.size, "N", "Lines or samples at most, 16 to 2048 (1024)")
        ->check(CLI::Range(16, 2048).description(""));
    add_option(command, "--band", asked.bands, "N[,N,N]",
               "One band, or three to be red, green and blue");
    command->add_flag("--raw", asked.raw, "Do not stretch: show the samples as they are");
    return command;
}

CLI::App *add_stats(CLI::App &app, stats_options &asked)
{
    CLI::App *const command =
        add_command(app, "stats", "Tell what the samples of an image are like");
    add_operand(command, "FILE", asked.in, "The image; - is standard input");
    command->add_flag("--json", asked.json, "Print an object");
    add_option(command, "--histogram", asked.histogram, "OUT.png",
               "Write a picture of the histogram and of the stretch");
    command->add_flag("--overwrite", asked.overwrite, "Replace the picture if it exists");
    return command;
}

CLI::App *add_compare(CLI::App &app, compare_options &asked)
{
    CLI::App *const command = add_command(app, "compare", "Compare two images sample by sample");
    add_operand(command, "A", asked.a, "An image; - is standard input");
    add_operand(command, "B", asked.b, "Another image, of any format");
    return command;
}

CLI::App *add_create(CLI::App &app, create_options &asked)
{
    CLI::App *const command = add_command(app, "create", "Create an image, all samples 0");
    add_output(command, asked.out, asked.overwrite, "What to write; its ending tells the type");
    const auto not_negative = CLI::Range(0, INT32_MAX).description("");
    add_option(command, "--lines", asked.nlines, "N", "Lines")->required()->check(not_negative);
    add_option(command, "--samples", asked.nsamps, "N", "Samples per line")
        ->required()
        ->check(not_negative);
    add_option(command, "--bands", asked.nbands, "N", "Bands (1)")->check(not_negative);
    add_option(command, "--bytes", asked.nbytes, "N", "Bytes of a sample, 1 or 2 (1)")
        ->check(CLI::Range(1, 2).description(""));
    add_option(command, "--type", asked.type, "TYPE", "vitec or helava, whatever OUT ends in")
        ->check(CLI::IsMember({"vitec", "helava"}, CLI::ignore_case).description(""));
    add_option(command, "--tile", asked.tile, "N|NxM",
               "Store in tiles of N x N, or N lines x M samples; or none");
    command->add_flag("--pattern", asked.pattern, "With a test pattern instead of zeros");
    return command;
}

// Prints one line to standard error; returns the status for wrong usage.
int tell_usage(const CLI::App &app, const std::string &what)
{
    std::string command = "imgfile";
    for (const CLI::App *each : app.get_subcommands()) command += " " + each->get_name();
    std::fprintf(stderr, "imgfile: %s (see %s --help)\n", in_one_line(what).c_str(),
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
    app.footer("Exit status: 0 done, 1 failed or found something, 2 wrong usage.\n"
               "\"imgfile COMMAND --help\" and \"man imgfile-COMMAND\" tell more.");
}

// Returns what is left to say about arguments that could not be parsed.
std::string complaint(const CLI::App &app, const CLI::ParseError &error)
{
    const std::vector<std::string> left = app.remaining();
    if (!app.get_subcommands().empty()) {
        const std::string what = error.what();
        return what.substr(0, what.find('\n'));
    }
    if (left.empty()) return "a command is required";
    return (left[0].starts_with('-') ? "there is no option " : "there is no command ") + left[0];
}

int run(int argc, char **argv)
{
    CLI::App app("Looks at VITec and Helava images, checks them, and moves them to and from\n"
                 "PGM, PPM, PNG and TIFF files.");
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
        return tell_usage(app, complaint(app, error));
    }
    try {
        for (const auto &[command, action] : commands)
            if (command->parsed()) return action();
    } catch (const wrong_usage &error) {
        return tell_usage(app, error.what());
    } catch (const failure &error) {
        std::fflush(stdout);
        std::fprintf(stderr, "imgfile: %s\n", error.what());
    } catch (const std::bad_alloc &) {
        std::fprintf(stderr, "imgfile: not enough memory\n");
    } catch (const std::exception &error) {
        std::fprintf(stderr, "imgfile: %s\n", error.what());
    }
    return 1;
}

}  // namespace

int main(int argc, char **argv)
{
    take_standard_descriptors();
    std::signal(SIGPIPE, SIG_IGN);  // a reader that went away is an error like others
    std::signal(SIGXFSZ, SIG_IGN);
    const int status = run(argc, argv);
    if (std::fflush(stdout) == 0 && std::ferror(stdout) == 0 && std::cout.flush().good())
        return status;
    std::fprintf(stderr, "imgfile: standard output: cannot be written\n");
    return 1;
}
