// The ZIP-based formats, read with libzip: the format comes from the archive's members (ODF and
// EPUB declare it in "mimetype"; OOXML is known by its main part), then the members that name
// fonts are inflated piece by piece into the XML, CSS or HTML readers. Every member inflates to
// at most kQZDocumentEntryLimit bytes and the archive to kQZDocumentInflateLimit, counted as the
// bytes come out (the sizes the archive declares are not trusted).
#include <zip.h>

#include <unistd.h>

#include <memory>
#include <string>

#include "documents/QZDocumentReaders.h"

namespace {

struct ZipCloser {
    void operator()(zip_t* archive) const { zip_discard(archive); }
};
using Archive = std::unique_ptr<zip_t, ZipCloser>;

struct ZipFileCloser {
    void operator()(zip_file_t* file) const { zip_fclose(file); }
};

bool EndsWithIgnoringCase(std::string_view text, std::string_view suffix) {
    if (text.size() < suffix.size())
        return false;
    for (size_t i = 0; i < suffix.size(); ++i) {
        if (glyphwell::LowerASCII(text[text.size() - suffix.size() + i]) != suffix[i])
            return false;
    }
    return true;
}

class ZipReader {
public:
    explicit ZipReader(zip_t* archive) : archive_(archive) {}

    QZDocumentScan Scan() {
        QZDocumentScan scan;
        const zip_int64_t count = zip_get_num_entries(archive_, 0);
        scan.format = Format();
        if (scan.format.empty()) {
            scan.error = error_.empty() ? "a ZIP archive in no format glyphwell reads" : error_;
            return scan;
        }
        QZFontCollector fonts;
        for (zip_int64_t index = 0; index < count; ++index) {
            const char* entry = zip_get_name(archive_, zip_uint64_t(index), 0);
            if (!entry)
                continue;
            const std::string_view name(entry);
            if (!ReadMember(scan.format, name, zip_uint64_t(index), fonts)) {
                scan.error = error_;
                return scan;
            }
        }
        fonts.TakeInto(scan);
        return scan;
    }

private:
    /// The format the members show; empty (and maybe an error) when none.
    std::string Format() {
        const zip_int64_t mimetype = zip_name_locate(archive_, "mimetype", 0);
        if (mimetype >= 0) {
            std::string type;
            if (!Inflate(zip_uint64_t(mimetype), "mimetype", 256,
                         [&](const char* bytes, size_t length) {
                             type.append(bytes, length);
                             return true;
                         }))
                return {};
            while (!type.empty() && (type.back() == '\n' || type.back() == '\r'))
                type.pop_back();
            static const std::pair<const char*, const char*> kTypes[] = {
                {"application/vnd.oasis.opendocument.text", "odt"},
                {"application/vnd.oasis.opendocument.spreadsheet", "ods"},
                {"application/vnd.oasis.opendocument.presentation", "odp"},
                {"application/epub+zip", "epub"}};
            for (const auto& [declared, format] : kTypes)
                if (type == declared)
                    return format;
        }
        static const std::pair<const char*, const char*> kMainParts[] = {
            {"word/document.xml", "docx"},
            {"ppt/presentation.xml", "pptx"},
            {"xl/workbook.xml", "xlsx"}};
        for (const auto& [part, format] : kMainParts)
            if (zip_name_locate(archive_, part, 0) >= 0)
                return format;
        return {};
    }

    bool ReadMember(const std::string& format, std::string_view name, zip_uint64_t index,
                    QZFontCollector& fonts) {
        const bool odf = format == "odt" || format == "ods" || format == "odp";
        const bool xml = odf ? (name == "content.xml" || name == "styles.xml")
                             : ((format == "docx" && name.starts_with("word/")) ||
                                (format == "pptx" && name.starts_with("ppt/")) ||
                                (format == "xlsx" && name.starts_with("xl/"))) &&
                                   EndsWithIgnoringCase(name, ".xml");
        if (xml) {
            QZXMLFontReader reader(fonts);
            std::string problem;
            const bool read =
                Inflate(index, name, kQZDocumentEntryLimit, [&](const char* bytes, size_t length) {
                    return reader.Feed(bytes, length, false, &problem);
                });
            if (read && reader.Feed("", 0, true, &problem))
                return true;
            if (error_.empty())
                error_ = std::string(name) + ": " + problem;
            return false;
        }
        const bool css = format == "epub" && EndsWithIgnoringCase(name, ".css");
        const bool html = format == "epub" && (EndsWithIgnoringCase(name, ".xhtml") ||
                                               EndsWithIgnoringCase(name, ".html") ||
                                               EndsWithIgnoringCase(name, ".htm"));
        if (!css && !html)
            return true;
        std::string text;
        if (!Inflate(index, name, kQZDocumentEntryLimit, [&](const char* bytes, size_t length) {
                text.append(bytes, length);
                return true;
            }))
            return false;
        if (css)
            QZCollectCSSStyleSheet(text, fonts);
        else
            QZCollectHTMLFonts(text, fonts);
        return true;
    }

    /// Inflates member `index` piece by piece into `sink` (false from it stops), at most `limit`
    /// bytes; false with error_ set when the member cannot be read or is too large.
    template <class Sink>
    bool Inflate(zip_uint64_t index, std::string_view name, uint64_t limit, Sink sink) {
        zip_stat_t stat;
        zip_stat_init(&stat);
        if (zip_stat_index(archive_, index, 0, &stat) == 0 &&
            (stat.valid & ZIP_STAT_ENCRYPTION_METHOD) && stat.encryption_method != ZIP_EM_NONE) {
            error_ = "encrypted ZIP member " + std::string(name);
            return false;
        }
        std::unique_ptr<zip_file_t, ZipFileCloser> file(zip_fopen_index(archive_, index, 0));
        if (!file) {
            error_ = "damaged ZIP member " + std::string(name) + ": " +
                     zip_error_strerror(zip_get_error(archive_));
            return false;
        }
        char buffer[64 * 1024];
        uint64_t total = 0;
        for (;;) {
            const zip_int64_t got = zip_fread(file.get(), buffer, sizeof buffer);
            if (got < 0) {
                error_ = "damaged ZIP member " + std::string(name) + ": " +
                         zip_error_strerror(zip_file_get_error(file.get()));
                return false;
            }
            if (got == 0)
                return true;
            total += uint64_t(got);
            inflated_ += uint64_t(got);
            if (total > limit) {
                error_ = "ZIP member " + std::string(name) + " inflates to more than " +
                         std::to_string(limit >> 20) + " MiB";
                return false;
            }
            if (inflated_ > kQZDocumentInflateLimit) {
                error_ = "ZIP archive inflates to more than " +
                         std::to_string(kQZDocumentInflateLimit >> 20) + " MiB";
                return false;
            }
            if (!sink(buffer, size_t(got)))
                return false;
        }
    }

    zip_t* archive_;
    uint64_t inflated_ = 0;
    std::string error_;
};

std::string OpenError(int code) {
    zip_error_t error;
    zip_error_init_with_code(&error, code);
    std::string text =
        code == ZIP_ER_NOZIP ? "not a ZIP archive"
        : code == ZIP_ER_INCONS || code == ZIP_ER_CRC
            ? std::string("damaged ZIP archive: ") + zip_error_strerror(&error)
            : std::string("cannot read the ZIP archive: ") + zip_error_strerror(&error);
    zip_error_fini(&error);
    return text;
}

} // namespace

QZDocumentScan QZScanZipDescriptor(int descriptor) {
    int code = 0;
    Archive archive(zip_fdopen(descriptor, ZIP_RDONLY | ZIP_CHECKCONS, &code));
    if (!archive) {
        close(descriptor);
        return {{}, {}, OpenError(code)};
    }
    return ZipReader(archive.get()).Scan();
}

QZDocumentScan QZScanZipBytes(std::string_view bytes) {
    zip_error_t error;
    zip_error_init(&error);
    zip_source_t* source = zip_source_buffer_create(bytes.data(), bytes.size(), 0, &error);
    Archive archive(source ? zip_open_from_source(source, ZIP_RDONLY | ZIP_CHECKCONS, &error)
                           : nullptr);
    if (!archive) {
        const int code = zip_error_code_zip(&error);
        if (source)
            zip_source_free(source);
        zip_error_fini(&error);
        return {{}, {}, OpenError(code)};
    }
    zip_error_fini(&error);
    return ZipReader(archive.get()).Scan();
}
