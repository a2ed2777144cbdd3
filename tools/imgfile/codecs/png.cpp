// PNG files of 8 or 16 bits, gray or RGB. libpng reads and writes them line by line. Read codecs.h
// first.
#include "codecs/codecs.h"
#include "codecs/pixels.h"
#include "failure.h"
#include "output_file.h"

#include <csetjmp>
#include <cstdio>
#include <png.h>

#include <unistd.h>

namespace {

// Why libpng failed. It reports a failure by a jump: actions of `guarded` must not create objects
// that have destructors.
struct png_failure {
    std::string reason;
    std::jmp_buf *back = nullptr;
};

[[noreturn]] void fail_png(png_structp png, png_const_charp message)
{
    auto &failed = *static_cast<png_failure *>(png_get_error_ptr(png));
    failed.reason = message;
    std::longjmp(*failed.back, 1);
}

void ignore_warning(png_structp /*png*/, png_const_charp /*message*/) {}

// Returns false when libpng failed.
template <typename Action>
bool guarded(png_failure &failed, Action action)
{
    std::jmp_buf back;
    failed.back = &back;
    if (setjmp(back) != 0) return false;
    action();
    return true;
}

class png_reader : public image_reader {
public:
    explicit png_reader(input_file file)
        : image_reader(file, file_format::png), m_file(::fdopen(file.release(), "rb"))
    {
        in_order = true;
        start();
        take_header();
    }
    ~png_reader() override { close(); }

    void read(const window &part, const band_list &bands, block &samples) override
    {
        if (part.line < m_next) start();
        const std::size_t pixel = form.pixel_size();
        m_pixels.resize(static_cast<std::size_t>(form.nsamps) * pixel);
        for (std::int32_t line = m_next; line < part.line + part.nlines; ++line) {
            if (!guarded(m_failed, [this] { png_read_row(m_png, m_pixels.data(), nullptr); }))
                throw failure(name,
                              text("line ", line, " is missing or damaged: ", m_failed.reason));
            if (line >= part.line)
                spread_pixels(&m_pixels[static_cast<std::size_t>(part.samp) * pixel], form.nbands,
                              bands, {line - part.line, 0, part.nsamps, 0}, samples);
        }
        m_next = part.line + part.nlines;
        if (m_next == form.nlines && !guarded(m_failed, [this] { png_read_end(m_png, nullptr); }))
            throw failure(name, "is truncated or damaged after its last line: " + m_failed.reason);
    }

private:
    // Reads the file up to its first line.
    void start()
    {
        png_destroy_read_struct(&m_png, &m_info, nullptr);
        m_png = png_create_read_struct(PNG_LIBPNG_VER_STRING, &m_failed, fail_png, ignore_warning);
        m_info = m_png != nullptr ? png_create_info_struct(m_png) : nullptr;
        if (m_info == nullptr) throw std::bad_alloc();
        std::rewind(m_file);
        m_next = 0;
        if (guarded(m_failed, [this] {
                png_init_io(m_png, m_file);
                png_set_user_limits(m_png, 0x7fffffff, 0x7fffffff);
                png_read_info(m_png, m_info);
                if (BIG_ENDIAN_IS_FOREIGN && png_get_bit_depth(m_png, m_info) == 16)
                    png_set_swap(m_png);
            }))
            return;
        close();
        throw failure(name, "is a damaged PNG file: " + m_failed.reason);
    }
    void take_header()
    {
        const int colors = png_get_color_type(m_png, m_info);
        const int depth = png_get_bit_depth(m_png, m_info);
        const char *problem = nullptr;
        if (colors != PNG_COLOR_TYPE_GRAY && colors != PNG_COLOR_TYPE_RGB)
            problem = colors == PNG_COLOR_TYPE_PALETTE ? "a palette" : "an alpha channel";
        else if (depth < 8)
            problem = "less than 8 bits per sample";
        else if (png_get_interlace_type(m_png, m_info) != PNG_INTERLACE_NONE)
            problem = "interlaced lines";
        if (problem != nullptr) {
            close();
            throw failure(name, text("has ", problem,
                                     "; only PNG files of 8 or 16 bits, gray or RGB, "
                                     "not interlaced, can be read"));
        }
        form = {.nlines = static_cast<std::int32_t>(png_get_image_height(m_png, m_info)),
                .nsamps = static_cast<std::int32_t>(png_get_image_width(m_png, m_info)),
                .nbands = colors == PNG_COLOR_TYPE_RGB ? 3 : 1,
                .nbytes = depth / 8,
                .nbits = depth};
    }
    void close()
    {
        png_destroy_read_struct(&m_png, &m_info, nullptr);
        if (m_file != nullptr) std::fclose(m_file);
        m_file = nullptr;
    }

    png_failure m_failed;
    std::FILE *m_file;
    png_structp m_png = nullptr;
    png_infop m_info = nullptr;
    std::int32_t m_next = 0;  // the line that libpng reads next
    std::vector<std::uint8_t> m_pixels;
};

void write_bytes(png_structp png, png_bytep bytes, std::size_t count)
{
    auto &[out, failed] =
        *static_cast<std::pair<output_file *, std::exception_ptr> *>(png_get_io_ptr(png));
    try {
        out->write(bytes, count);
        return;
    } catch (...) {
        failed = std::current_exception();
    }
    png_error(png, "not written");  // by a jump, after the handler has ended
}

class png_writer : public image_writer {
public:
    png_writer(output_file &out, const shape &form) : m_io(&out, nullptr), m_name(out.name())
    {
        in_order = true;
        m_png = png_create_write_struct(PNG_LIBPNG_VER_STRING, &m_failed, fail_png, ignore_warning);
        m_info = m_png != nullptr ? png_create_info_struct(m_png) : nullptr;
        if (m_info == nullptr) throw std::bad_alloc();
        check(guarded(m_failed, [&] {
            png_set_user_limits(m_png, 0x7fffffff, 0x7fffffff);
            png_set_write_fn(m_png, &m_io, write_bytes, nullptr);
            png_set_IHDR(m_png, m_info, static_cast<png_uint_32>(form.nsamps),
                         static_cast<png_uint_32>(form.nlines), form.nbytes * 8,
                         form.nbands == 3 ? PNG_COLOR_TYPE_RGB : PNG_COLOR_TYPE_GRAY,
                         PNG_INTERLACE_NONE, PNG_COMPRESSION_TYPE_DEFAULT, PNG_FILTER_TYPE_DEFAULT);
            png_write_info(m_png, m_info);
            if (BIG_ENDIAN_IS_FOREIGN && form.nbytes == 2) png_set_swap(m_png);
        }));
    }
    ~png_writer() override { png_destroy_write_struct(&m_png, &m_info); }

    void write(const window & /*part*/, const block &samples) override
    {
        m_pixels.resize(samples.bytes.size() / static_cast<std::size_t>(samples.nlines));
        for (std::int32_t line = 0; line < samples.nlines; ++line) {
            gather_pixels(samples, {line, 0, samples.nsamps, 0}, m_pixels.data());
            check(guarded(m_failed, [this] { png_write_row(m_png, m_pixels.data()); }));
        }
    }
    std::int64_t finish() override
    {
        check(guarded(m_failed, [this] { png_write_end(m_png, m_info); }));
        return -1;
    }

private:
    void check(bool done)
    {
        if (done) return;
        if (m_io.second) std::rethrow_exception(m_io.second);
        throw failure(m_name, "cannot be written: " + m_failed.reason);
    }

    png_failure m_failed;
    std::pair<output_file *, std::exception_ptr> m_io;
    std::string m_name;
    png_structp m_png = nullptr;
    png_infop m_info = nullptr;
    std::vector<std::uint8_t> m_pixels;
};

}  // namespace

std::unique_ptr<image_reader> open_png(input_file file)
{
    return std::make_unique<png_reader>(std::move(file));
}

std::unique_ptr<image_writer> create_png(output_file &out, const shape &form)
{
    if (form.nbands != 1 && form.nbands != 3)
        throw failure(out.name(), text("PNG files hold 1 or 3 bands, not ", form.nbands,
                                       "; --band chooses some"));
    if (form.nsamples() == 0) throw failure(out.name(), "PNG files cannot be empty");
    return std::make_unique<png_writer>(out, form);
}
