// Opening a document and choosing its reader from the first bytes: "%PDF-" near the start is a
// PDF, a ZIP signature an archive format, "[Script Info]" a subtitle file, an HTML doctype or
// <html> HTML, other markup XML (SVG, flat ODF, XHTML: the root element decides).
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "documents/QZDocumentReaders.h"

namespace {

bool StartsWithIgnoringCase(std::string_view text, std::string_view prefix) {
    if (text.size() < prefix.size())
        return false;
    for (size_t i = 0; i < prefix.size(); ++i)
        if (glyphwell::LowerASCII(text[i]) != prefix[i])
            return false;
    return true;
}

enum class Syntax { PDF, Zip, Subtitles, HTML, XML, Unknown };

Syntax SyntaxOf(std::string_view head) {
    if (head.substr(0, 1024).find("%PDF-") != std::string_view::npos)
        return Syntax::PDF;
    if (head.starts_with("PK\x03\x04") || head.starts_with("PK\x05\x06"))
        return Syntax::Zip;
    if (head.starts_with("\xEF\xBB\xBF"))
        head.remove_prefix(3);
    while (!head.empty() && (head.front() == ' ' || head.front() == '\t' || head.front() == '\r' ||
                             head.front() == '\n'))
        head.remove_prefix(1);
    if (StartsWithIgnoringCase(head, "[script info]"))
        return Syntax::Subtitles;
    if (StartsWithIgnoringCase(head, "<!doctype html") || StartsWithIgnoringCase(head, "<html"))
        return Syntax::HTML;
    if (head.starts_with("<"))
        return Syntax::XML;
    return Syntax::Unknown;
}

/// Reads an XML document fed by `read` (pieces until an empty one); the root decides the format.
template <class Read> QZDocumentScan ScanXML(Read read) {
    QZDocumentScan scan;
    QZFontCollector fonts;
    QZXMLFontReader reader(fonts);
    std::string error;
    bool more = true;
    while (more && error.empty()) {
        std::string_view piece;
        if (!read(&piece, &error))
            break;
        more = !piece.empty();
        if (!reader.Feed(piece.data(), piece.size(), !more, &error))
            break;
    }
    const std::string& root = reader.RootName();
    scan.format = root == "svg" ? "svg" : root == "html" ? "html" : reader.DeclaredFormat();
    if (!error.empty()) {
        scan.error = error;
    } else if (scan.format.empty()) {
        scan.error = "an XML document in no format glyphwell reads (root element " + root + ")";
    }
    if (scan.error.empty())
        fonts.TakeInto(scan);
    return scan;
}

QZDocumentScan ScanText(Syntax syntax, std::string_view text) {
    QZDocumentScan scan;
    QZFontCollector fonts;
    if (syntax == Syntax::Subtitles) {
        QZCollectSubtitleFonts(text, fonts, &scan.format);
    } else {
        scan.format = "html";
        QZCollectHTMLFonts(text, fonts);
    }
    fonts.TakeInto(scan);
    return scan;
}

QZDocumentScan Failure(std::string error) {
    return {{}, {}, std::move(error)};
}

/// Reads up to `length` bytes at `offset`; false with errno set on a failure.
bool ReadAt(int descriptor, char* buffer, size_t length, off_t offset, size_t* got) {
    *got = 0;
    while (*got < length) {
        const ssize_t n = pread(descriptor, buffer + *got, length - *got, offset + off_t(*got));
        if (n < 0 && errno == EINTR)
            continue;
        if (n < 0)
            return false;
        if (n == 0)
            break;
        *got += size_t(n);
    }
    return true;
}

} // namespace

const char* QZDocumentFontKindName(QZDocumentFontKind kind) {
    switch (kind) {
    case QZDocumentFontKind::PostScript:
        return "postscript";
    case QZDocumentFontKind::Family:
        return "family";
    case QZDocumentFontKind::Full:
        return "full";
    }
    return "family";
}

QZDocumentScan QZScanDocumentBytes(std::string_view bytes) {
    const Syntax syntax = SyntaxOf(bytes.substr(0, 4096));
    switch (syntax) {
    case Syntax::PDF:
        return QZScanPDFBytes(bytes);
    case Syntax::Zip:
        return QZScanZipBytes(bytes);
    case Syntax::XML: {
        QZDocumentScan scan =
            ScanXML([&, done = false](std::string_view* piece, std::string*) mutable {
                *piece = done ? std::string_view() : bytes;
                done = true;
                return true;
            });
        // XHTML that is not well-formed XML (an undeclared &nbsp;, say) is still HTML.
        if (scan.error.empty() || scan.format != "html" || bytes.size() > kQZDocumentTextLimit)
            return scan;
        return ScanText(Syntax::HTML, bytes);
    }
    case Syntax::Subtitles:
    case Syntax::HTML:
        if (bytes.size() > kQZDocumentTextLimit)
            return Failure("a text document larger than 64 MiB");
        return ScanText(syntax, bytes);
    case Syntax::Unknown:
        break;
    }
    return Failure("not a document format glyphwell reads");
}

QZDocumentScan QZScanDocumentFile(const std::string& path) {
    // O_NONBLOCK: opening a FIFO must not wait for a writer; fstat then refuses it.
    const int descriptor = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK);
    if (descriptor < 0)
        return Failure(std::strerror(errno));
    struct stat status = {};
    if (fstat(descriptor, &status) != 0) {
        const int error = errno;
        close(descriptor);
        return Failure(std::strerror(error));
    }
    if (!S_ISREG(status.st_mode)) {
        close(descriptor);
        return Failure(S_ISDIR(status.st_mode)    ? "a directory, not a document"
                       : S_ISFIFO(status.st_mode) ? "a FIFO, not a document"
                                                  : "not a regular file");
    }
    if (uint64_t(status.st_size) > kQZDocumentFileLimit) {
        close(descriptor);
        return Failure("larger than " + std::to_string(kQZDocumentFileLimit >> 20) +
                       " MiB, more than any document glyphwell reads");
    }
    fcntl(descriptor, F_SETFL, fcntl(descriptor, F_GETFL) & ~O_NONBLOCK);

    char head[4096];
    size_t got = 0;
    if (!ReadAt(descriptor, head, sizeof head, 0, &got)) {
        const int error = errno;
        close(descriptor);
        return Failure(std::strerror(error));
    }
    const Syntax syntax = SyntaxOf(std::string_view(head, got));
    if (syntax == Syntax::Zip)
        return QZScanZipDescriptor(descriptor); // takes the descriptor
    QZDocumentScan scan;
    Syntax text = syntax;
    if (syntax == Syntax::PDF) {
        FILE* file = fdopen(descriptor, "rb");
        if (!file) {
            close(descriptor);
            return Failure(std::strerror(errno));
        }
        scan = QZScanPDFFile(file, path);
        fclose(file);
        return scan;
    }
    if (syntax == Syntax::XML) {
        std::string buffer(64 * 1024, '\0');
        off_t offset = 0;
        scan = ScanXML([&](std::string_view* piece, std::string* error) {
            size_t length = 0;
            if (!ReadAt(descriptor, buffer.data(), buffer.size(), offset, &length)) {
                *error = std::strerror(errno);
                return false;
            }
            offset += off_t(length);
            *piece = std::string_view(buffer.data(), length);
            return true;
        });
        // XHTML that is not well-formed XML (an undeclared &nbsp;, say) is read again as HTML.
        if (scan.error.empty() || scan.format != "html") {
            close(descriptor);
            return scan;
        }
        text = Syntax::HTML;
    }
    if (syntax == Syntax::Unknown) {
        scan = Failure("not a document format glyphwell reads");
    } else if (uint64_t(status.st_size) > kQZDocumentTextLimit) {
        scan = Failure("a text document larger than 64 MiB");
    } else {
        std::string contents(size_t(status.st_size), '\0');
        if (!ReadAt(descriptor, contents.data(), contents.size(), 0, &got))
            scan = Failure(std::strerror(errno));
        else
            scan = ScanText(text, std::string_view(contents.data(), got));
    }
    close(descriptor);
    return scan;
}
