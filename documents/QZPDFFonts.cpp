// The fonts of a PDF, read with libqpdf the way a viewer finds them: every page's resources (its
// own or inherited), the form XObjects, patterns and Type 3 fonts they use, and the appearance
// streams of the annotations. A font is named by its /BaseFont (for a Type 0 font, its
// descendant's) or else its descriptor's /FontName, with the subset tag ("ABCDEF+") removed;
// it is embedded when its descriptor holds a font file stream.
//
// A damaged cross-reference table is an error rather than repaired: a reader that guessed would
// report fonts the file may not use. Resources that contain themselves are an error too.
#include <qpdf/QPDF.hh>
#include <qpdf/QPDFExc.hh>
#include <qpdf/QPDFPageObjectHelper.hh>

#include <set>
#include <stdexcept>

#include "documents/QZDocumentReaders.h"

namespace {

struct ReferenceLoop : std::runtime_error {
    using std::runtime_error::runtime_error;
};

/// `name` without the subset tag: six upper-case letters and a plus sign.
std::string_view WithoutSubsetTag(std::string_view name) {
    if (name.size() > 7 && name[6] == '+') {
        for (size_t i = 0; i < 6; ++i)
            if (name[i] < 'A' || name[i] > 'Z')
                return name;
        return name.substr(7);
    }
    return name;
}

class PDFFontWalker {
public:
    explicit PDFFontWalker(QZFontCollector& fonts) : fonts_(fonts) {}

    void Page(QPDFObjectHandle page) {
        QPDFPageObjectHelper helper(page);
        Resources(helper.getAttribute("/Resources", false), 0);
        QPDFObjectHandle annotations = page.getKey("/Annots");
        if (!annotations.isArray())
            return;
        for (QPDFObjectHandle annotation : annotations.aitems()) {
            if (!annotation.isDictionary())
                continue;
            QPDFObjectHandle normal = annotation.getKey("/AP").isDictionary()
                                          ? annotation.getKey("/AP").getKey("/N")
                                          : QPDFObjectHandle::newNull();
            if (normal.isStream())
                Form(normal, 0);
            else if (normal.isDictionary())
                for (auto [state, appearance] : normal.ditems())
                    if (appearance.isStream())
                        Form(appearance, 0);
        }
    }

private:
    /// A content stream with resources of its own (a form XObject, a pattern, an appearance).
    void Form(QPDFObjectHandle stream, unsigned depth) {
        Enter(stream, depth, [&] { Resources(stream.getDict().getKey("/Resources"), depth + 1); });
    }

    void Resources(QPDFObjectHandle resources, unsigned depth) {
        if (!resources.isDictionary())
            return;
        Enter(resources, depth, [&] {
            QPDFObjectHandle fonts = resources.getKey("/Font");
            if (fonts.isDictionary())
                for (auto [key, font] : fonts.ditems())
                    Font(font, depth + 1);
            for (const char* kind : {"/XObject", "/Pattern"}) {
                QPDFObjectHandle entries = resources.getKey(kind);
                if (!entries.isDictionary())
                    continue;
                for (auto [key, entry] : entries.ditems())
                    if (entry.isStream() &&
                        (std::string_view(kind) == "/Pattern" ||
                         entry.getDict().getKey("/Subtype").isNameAndEquals("/Form")))
                        Form(entry, depth + 1);
            }
        });
    }

    void Font(QPDFObjectHandle font, unsigned depth) {
        if (!font.isDictionary())
            return;
        Enter(font, depth, [&] {
            QPDFObjectHandle subtype = font.getKey("/Subtype");
            if (subtype.isNameAndEquals("/Type0")) {
                QPDFObjectHandle descendants = font.getKey("/DescendantFonts");
                if (descendants.isArray())
                    for (QPDFObjectHandle descendant : descendants.aitems())
                        Font(descendant, depth + 1);
                return;
            }
            if (subtype.isNameAndEquals("/Type3"))
                Resources(font.getKey("/Resources"), depth + 1);
            QPDFObjectHandle descriptor = font.getKey("/FontDescriptor");
            QPDFObjectHandle name = font.getKey("/BaseFont");
            if (!name.isName() && descriptor.isDictionary())
                name = descriptor.getKey("/FontName");
            if (!name.isName())
                return;
            const bool embedded =
                descriptor.isDictionary() && (descriptor.getKey("/FontFile").isStream() ||
                                              descriptor.getKey("/FontFile2").isStream() ||
                                              descriptor.getKey("/FontFile3").isStream());
            const std::string text = name.getName();
            fonts_.AddCommaStyled(WithoutSubsetTag(std::string_view(text).substr(1)), embedded);
        });
    }

    /// Runs `visit` for `object` unless it was visited before; an object met again while it is
    /// being visited is a reference loop.
    template <class Visit> void Enter(QPDFObjectHandle object, unsigned depth, Visit visit) {
        if (depth > kQZDocumentDepthLimit)
            throw ReferenceLoop("resources nested deeper than " +
                                std::to_string(kQZDocumentDepthLimit));
        if (!object.isIndirect()) {
            visit();
            return;
        }
        const QPDFObjGen id = object.getObjGen();
        if (path_.count(id))
            throw ReferenceLoop("reference loop at object " + std::to_string(id.getObj()));
        if (!done_.insert(id).second)
            return;
        path_.insert(id);
        visit();
        path_.erase(id);
    }

    QZFontCollector& fonts_;
    std::set<QPDFObjGen> path_;
    std::set<QPDFObjGen> done_;
};

template <class Open> QZDocumentScan ScanPDF(Open open) {
    QZDocumentScan scan;
    scan.format = "pdf";
    QZFontCollector fonts;
    try {
        QPDF pdf;
        pdf.setSuppressWarnings(true);
        pdf.setAttemptRecovery(false);
        open(pdf);
        PDFFontWalker walker(fonts);
        for (const QPDFObjectHandle& page : pdf.getAllPages())
            walker.Page(page);
        if (pdf.anyWarnings()) {
            const std::vector<QPDFExc> warnings = pdf.getWarnings();
            throw std::runtime_error(warnings.empty() ? "unreadable objects"
                                                      : warnings.front().getMessageDetail());
        }
    } catch (const QPDFExc& exception) {
        scan.error = exception.getErrorCode() == qpdf_e_password
                         ? "encrypted PDF: a password is needed"
                         : "damaged PDF: " + exception.getMessageDetail();
        return scan;
    } catch (const ReferenceLoop& loop) {
        scan.error = std::string("damaged PDF: ") + loop.what();
        return scan;
    } catch (const std::bad_alloc&) {
        scan.error = "out of memory";
        return scan;
    } catch (const std::exception& exception) {
        scan.error = std::string("damaged PDF: ") + exception.what();
        return scan;
    }
    fonts.TakeInto(scan);
    return scan;
}

} // namespace

QZDocumentScan QZScanPDFFile(FILE* file, const std::string& description) {
    return ScanPDF([&](QPDF& pdf) { pdf.processFile(description.c_str(), file, false); });
}

QZDocumentScan QZScanPDFBytes(std::string_view bytes) {
    return ScanPDF(
        [&](QPDF& pdf) { pdf.processMemoryFile("document", bytes.data(), bytes.size()); });
}
