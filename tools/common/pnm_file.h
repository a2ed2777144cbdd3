// Binary PGM (P5) and PPM (P6) files: a header of text, then the samples pixel by pixel and line by
// line, the high byte of a two-byte sample first. The tool and the demonstration read such files
// with it.
#ifndef TOOLS_PNM_FILE_H
#define TOOLS_PNM_FILE_H

#include <cstdint>
#include <span>
#include <string_view>

struct pnm_header {
    std::int32_t nlines, nsamps;  // at least 1 each
    std::int32_t nbands;          // 1 in PGM files, 3 in PPM files
    std::int32_t highest;         // the highest sample value that the header states: 1 to 65535
    std::int64_t data_offset;     // of the first sample, in bytes

    std::int32_t nbytes() const { return highest > 255 ? 2 : 1; }  // of a sample
    std::int64_t pixel_length() const { return std::int64_t{nbands} * nbytes(); }
    std::int64_t line_length() const { return nsamps * pixel_length(); }
    // Bytes of the whole file; -1: more than any file can hold.
    std::int64_t file_length() const;
};

// Reads the header in the first bytes of a file. Throws std::runtime_error, whose text says what is
// wrong with the file, when they do not hold a whole and valid header.
pnm_header parse_pnm_header(std::string_view start);

// A file that is open for reading. All functions throw std::runtime_error, whose text says what is
// wrong with the file.
class pnm_file {
public:
    // Reads the header. `fd` stays open, and the caller's.
    explicit pnm_file(int fd);
    const pnm_header &header() const { return m_header; }

    // Fills `pixels` with bytes of the samples as the file holds them: with the part of a line that
    // starts `first_byte` bytes after its start, or with more than one whole line, from line `line`
    // on.
    void read(std::int64_t line, std::int64_t first_byte, std::span<std::uint8_t> pixels) const;

private:
    int m_fd;
    pnm_header m_header;
};

#endif
