// The fonts a document names: a reader per document format, chosen from the file's content (never
// its name), that lists every font the document asks for, how it names it and whether the file
// carries the font itself.
//
// Readers of outside bytes: whatever a file holds, a scan reads nothing outside it, inflates at
// most kQZDocumentEntryLimit bytes per archive member and kQZDocumentInflateLimit in all, nests
// at most kQZDocumentDepthLimit levels, and ends with an error rather than a partial list.
// No Qt; thread-safe (every call works on its own state).
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

/// How a document names a font.
enum class QZDocumentFontKind {
    PostScript, ///< a PostScript name ("Lato-Bold")
    Family,     ///< a family name ("Lato"), maybe with a style
    Full        ///< a full face name ("Lato Bold")
};

/// One font a document names.
struct QZDocumentFont {
    std::string name;
    QZDocumentFontKind kind = QZDocumentFontKind::Family;
    std::string style;     ///< e.g. "Bold"; empty when the document gives none
    bool embedded = false; ///< the document carries the font itself

    bool operator==(const QZDocumentFont&) const = default;
};

/// What a scan found: the format and the fonts, or why the file cannot be read.
struct QZDocumentScan {
    std::string format;                ///< "pdf", "docx", "odt", "svg", ...; empty when unknown
    std::vector<QZDocumentFont> fonts; ///< in order of first mention, each once
    std::string error;                 ///< empty on success, else the reason, e.g. "encrypted"
};

inline constexpr uint64_t kQZDocumentFileLimit = uint64_t(1) << 30;      ///< largest file read
inline constexpr uint64_t kQZDocumentTextLimit = uint64_t(64) << 20;     ///< largest text file
inline constexpr uint64_t kQZDocumentEntryLimit = uint64_t(64) << 20;    ///< per archive member
inline constexpr uint64_t kQZDocumentInflateLimit = uint64_t(128) << 20; ///< per archive
inline constexpr unsigned kQZDocumentDepthLimit = 256; ///< XML element and CSS block nesting

/// Scans the file at `path`. Only regular files are read: a directory, a FIFO or a device gives
/// an error at once (a FIFO never blocks the call).
QZDocumentScan QZScanDocumentFile(const std::string& path);

/// Scans a document held in memory, like QZScanDocumentFile.
QZDocumentScan QZScanDocumentBytes(std::string_view bytes);

/// The name of `kind` as scripts see it: "postscript", "family" or "full".
const char* QZDocumentFontKindName(QZDocumentFontKind kind);
