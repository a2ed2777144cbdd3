// PNG files of 8 or 16 bits, gray or RGB.
#include "failure.h"
#include "image.h"
#include "output.h"
#include "samples.h"

#include <csetjmp>
#include <cstdio>
#include <png.h>

#include <unistd.h>

namespace {

// What libpng gives as the reason of a failure. It leaves by a jump: what runs in `guarded` must
// not have made objects that want to be destroyed.
struct png_failure {
    std::string what;
    std::jmp_buf *back = nullptr;
};

[[noreturn]] void fail_png(png_structp png, png_const_charp message)
{
    auto &failed = *static_cast<png_failure *>(png_get_error_ptr(png));
    failed.what = message;
    std::longjmp(*failed.back, 1);
}

void pass_over(png_structp /*png*/, png_const_charp /*message*/) {}

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
    png_reader(const std::string &path, int fd)
        : image_reader(path, file_format::png), m_file(::fdopen(fd, "rb"))
    {
        in_order = true;
        m_png = png_create_read_struct(PNG_LIBPNG_VER_STRING, &m_failed, fail_png, pass_over);
        m_info = m_png != nullptr ? png_create_info_struct(m_png) : nullptr;
        if (m_info == nullptr) throw std::bad_alloc();
        if (!guarded(m_failed, [this] {
                png_init_io(m_png, m_file);
                png_set_user_limits(m_png, 0x7fffffff, 0x7fffffff);
                png_read_info(m_png, m_info);
            })) {
            close();
            throw failure(name, "is a damaged PNG file: " + m_failed.what);
        }
        take_header();
    }
    ~png_reader() override { close(); }

    void read(const window &part, const band_list &bands, block &to) override
    {
        const auto pixel = static_cast<std::size_t>(form.nbands * form.nbytes);
        m_pixels.resize(static_cast<std::size_t>(form.nsamps) * pixel);
        for (std::int32_t line = m_next; line < part.line + part.nlines; ++line) {
            if (!guarded(m_failed, [this] { png_read_row(m_png, m_pixels.data(), nullptr); }))
                throw failure(name, text("line ", line, " is missing or damaged: ", m_failed.what));
            if (line >= part.line)
                spread_pixels(&m_pixels[static_cast<std::size_t>(part.samp) * pixel], form.nbands,
                              bands, {line - part.line, 0, part.nsamps, 0}, to);
        }
        m_next = part.line + part.nlines;
        if (m_next == form.nlines && !guarded(m_failed, [this] { png_read_end(m_png, nullptr); }))
            throw failure(name, "is cut short or damaged after its last line: " + m_failed.what);
    }

private:
    void take_header()
    {
        const int colors = png_get_color_type(m_png, m_info);
        const int depth = png_get_bit_depth(m_png, m_info);
        const char *unfit = nullptr;
        if (colors != PNG_COLOR_TYPE_GRAY && colors != PNG_COLOR_TYPE_RGB)
            unfit = colors == PNG_COLOR_TYPE_PALETTE ? "a palette" : "an alpha channel";
        else if (depth < 8)
            unfit = "less than 8 bits per sample";
        else if (png_get_interlace_type(m_png, m_info) != PNG_INTERLACE_NONE)
            unfit = "interlaced lines";
        if (unfit != nullptr) {
            close();
            throw failure(name, text("has ", unfit,
                                     "; PNG files of 8 or 16 bits, gray or RGB, in "
                                     "plain order are read"));
        }
        form = {.nlines = static_cast<std::int32_t>(png_get_image_height(m_png, m_info)),
                .nsamps = static_cast<std::int32_t>(png_get_image_width(m_png, m_info)),
                .nbands = colors == PNG_COLOR_TYPE_RGB ? 3 : 1,
                .nbytes = depth / 8,
                .nbits = depth};
        if (BIG_ENDIAN_IS_FOREIGN && form.nbytes == 2) png_set_swap(m_png);
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
    std::int32_t m_next = 0;
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
        m_png = png_create_write_struct(PNG_LIBPNG_VER_STRING, &m_failed, fail_png, pass_over);
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

    void write(const window & /*at*/, const block &from) override
    {
        m_pixels.resize(from.bytes.size() / static_cast<std::size_t>(from.nlines));
        for (std::int32_t line = 0; line < from.nlines; ++line) {
            gather_pixels(from, {line, 0, from.nsamps, 0}, m_pixels.data());
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
        throw failure(m_name, "cannot be written: " + m_failed.what);
    }

    png_failure m_failed;
    std::pair<output_file *, std::exception_ptr> m_io;
    std::string m_name;
    png_structp m_png = nullptr;
    png_infop m_info = nullptr;
    std::vector<std::uint8_t> m_pixels;
};

}  // namespace

std::unique_ptr<image_reader> open_png(const std::string &name, int fd)
{
    return std::make_unique<png_reader>(name, fd);
}

std::unique_ptr<image_writer> create_png(output_file &out, const shape &form)
{
    if (form.nbands != 1 && form.nbands != 3)
        throw failure(out.name(), text("PNG files hold 1 or 3 bands, not ", form.nbands,
                                       "; --band chooses some"));
    if (form.nsamples() == 0) throw failure(out.name(), "an empty image is no PNG picture");
    return std::make_unique<png_writer>(out, form);
}
