// Reading the fonts of documents: a 100-page PDF with 40 fonts, next to pdffonts (poppler-utils)
// on the same file, and a 20 MB DOCX. Each document is scanned in the benchmark's own process
// (time), and in a child process (time and resident memory, with the child's peak RSS from
// wait4), so that pdffonts, a process of its own, is compared like for like.
//
// The inputs are written to the temporary directory when the program starts and removed at the
// end; none is checked in. RESULTS.md, "Document fonts", has the figures and the command.
#include <benchmark/benchmark.h>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>
#include <zip.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <random>
#include <string>
#include <vector>

#include "documents/QZDocumentFonts.h"
#include "support/PDFFile.h"

extern char** environ;

namespace {

const std::string kDirectory = std::filesystem::temp_directory_path() / "glyphwell-document-bench";
const std::string kPDF = kDirectory + "/pages.pdf";
const std::string kDOCX = kDirectory + "/large.docx";
constexpr int kFonts = 40;
constexpr int kPages = 100;

/// A PDF of kPages pages, each showing text in every one of kFonts fonts (half of them carrying
/// a font file), with the page tree, content streams and a cross-reference table.
std::string MakePDF() {
    std::vector<std::string> objects = {"<< /Type /Catalog /Pages 2 0 R >>", ""};
    std::string fonts = "<< ";
    for (int f = 0; f < kFonts; ++f) {
        const int font = int(objects.size()) + 1;
        const std::string name = "Family" + std::to_string(f) + "-Regular";
        if (f % 2) {
            objects.push_back("<< /Type /Font /Subtype /TrueType /BaseFont /ABCDEF+" + name +
                              " /FontDescriptor " + std::to_string(font + 1) + " 0 R >>");
            objects.push_back("<< /Type /FontDescriptor /FontName /ABCDEF+" + name +
                              " /Flags 32 /FontFile2 " + std::to_string(font + 2) + " 0 R >>");
            objects.push_back("<< /Length 1024 >>\nstream\n" + std::string(1024, 'x') +
                              "\nendstream");
        } else {
            objects.push_back("<< /Type /Font /Subtype /Type1 /BaseFont /" + name + " >>");
        }
        fonts += "/F" + std::to_string(f) + " " + std::to_string(font) + " 0 R ";
    }
    fonts += ">>";
    const int resources = int(objects.size()) + 1;
    objects.push_back("<< /Font " + fonts + " >>");
    std::string kids;
    for (int p = 0; p < kPages; ++p) {
        std::string content = "BT ";
        for (int line = 0; line < 40; ++line)
            content += "/F" + std::to_string(line % kFonts) + " 10 Tf 20 " +
                       std::to_string(800 - line * 19) + " Td (A line of text in a font.) Tj ";
        content += "ET";
        const int page = int(objects.size()) + 1;
        objects.push_back("<< /Type /Page /Parent 2 0 R /MediaBox [0 0 595 842] /Resources " +
                          std::to_string(resources) + " 0 R /Contents " + std::to_string(page + 1) +
                          " 0 R >>");
        objects.push_back("<< /Length " + std::to_string(content.size()) + " >>\nstream\n" +
                          content + "\nendstream");
        kids += std::to_string(page) + " 0 R ";
    }
    objects[1] = "<< /Type /Pages /Kids [" + kids + "] /Count " + std::to_string(kPages) + " >>";
    return glyphwell::testing::PDFFromObjects(objects);
}

/// A DOCX of about 20 MB: 48 MiB of paragraphs whose runs name kFonts fonts (deflated to a few
/// MB) and 18 MB of incompressible media, as pictures make real documents large.
void MakeDOCX() {
    // Locals, freed before any benchmark runs: the forked children start from a small parent.
    std::string document, media, types;
    document = "<?xml version=\"1.0\"?><w:document xmlns:w=\"http://schemas.openxmlformats.org/"
               "wordprocessingml/2006/main\"><w:body>";
    for (int i = 0; document.size() < (size_t(48) << 20); ++i)
        document += "<w:p><w:r><w:rPr><w:rFonts w:ascii=\"Family" + std::to_string(i % kFonts) +
                    "\" w:hAnsi=\"Family" + std::to_string(i % kFonts) +
                    "\"/><w:b/></w:rPr><w:t>A paragraph of some length, in one of forty "
                    "fonts.</w:t></w:r></w:p>";
    document += "</w:body></w:document>";
    std::mt19937 random(1);
    media.resize(size_t(18) << 20);
    for (char& c : media)
        c = char(random());
    types = "<?xml version=\"1.0\"?><Types/>";
    int error = 0;
    zip_t* archive = zip_open(kDOCX.c_str(), ZIP_CREATE | ZIP_TRUNCATE, &error);
    const std::pair<const char*, std::string*> members[] = {{"[Content_Types].xml", &types},
                                                            {"word/document.xml", &document},
                                                            {"word/media/image1.png", &media}};
    for (const auto& [name, bytes] : members) {
        const zip_int64_t index = zip_file_add(
            archive, name, zip_source_buffer(archive, bytes->data(), bytes->size(), 0), 0);
        if (bytes == &media)
            zip_set_file_compression(archive, zip_uint64_t(index), ZIP_CM_STORE, 0);
    }
    zip_close(archive);
}

/// Runs `child` in a forked process (or execs `program`), and reports its peak RSS in MiB.
template <class Child> void InChild(benchmark::State& state, Child child) {
    long peak = 0;
    for (auto _ : state) {
        const pid_t pid = fork();
        if (pid == 0)
            _exit(child());
        int status = 0;
        struct rusage usage = {};
        wait4(pid, &status, 0, &usage);
        if (!WIFEXITED(status) || WEXITSTATUS(status) != 0)
            state.SkipWithError("the child failed");
        peak = std::max(peak, usage.ru_maxrss);
    }
    state.counters["peak_RSS_MiB"] = double(peak) / 1024.0;
}

int ScanOrFail(const std::string& path, size_t fonts) {
    const QZDocumentScan scan = QZScanDocumentFile(path);
    return scan.error.empty() && scan.fonts.size() == fonts ? 0 : 1;
}

/// What a forked child of this program holds before it does anything: the floor of the figures.
void BM_Baseline_Process(benchmark::State& state) {
    InChild(state, [] { return 0; });
}
BENCHMARK(BM_Baseline_Process)->Unit(benchmark::kMillisecond)->UseRealTime();

void BM_PDF_Glyphwell(benchmark::State& state) {
    for (auto _ : state) {
        QZDocumentScan scan = QZScanDocumentFile(kPDF);
        if (scan.fonts.size() != kFonts)
            state.SkipWithError(("unexpected result: " + scan.error).c_str());
        benchmark::DoNotOptimize(scan);
    }
}
BENCHMARK(BM_PDF_Glyphwell)->Unit(benchmark::kMillisecond);

void BM_PDF_Glyphwell_Process(benchmark::State& state) {
    InChild(state, [] { return ScanOrFail(kPDF, kFonts); });
}
BENCHMARK(BM_PDF_Glyphwell_Process)->Unit(benchmark::kMillisecond)->UseRealTime();

void BM_PDF_pdffonts_Process(benchmark::State& state) {
    InChild(state, [] {
        freopen("/dev/null", "w", stdout);
        freopen("/dev/null", "w", stderr); // it warns about the placeholder font files
        execlp("pdffonts", "pdffonts", kPDF.c_str(), nullptr);
        return 127;
    });
}
BENCHMARK(BM_PDF_pdffonts_Process)->Unit(benchmark::kMillisecond)->UseRealTime();

void BM_DOCX_Glyphwell(benchmark::State& state) {
    for (auto _ : state) {
        QZDocumentScan scan = QZScanDocumentFile(kDOCX);
        if (scan.fonts.size() != kFonts)
            state.SkipWithError(("unexpected result: " + scan.error).c_str());
        benchmark::DoNotOptimize(scan);
    }
}
BENCHMARK(BM_DOCX_Glyphwell)->Unit(benchmark::kMillisecond);

void BM_DOCX_Glyphwell_Process(benchmark::State& state) {
    InChild(state, [] { return ScanOrFail(kDOCX, kFonts); });
}
BENCHMARK(BM_DOCX_Glyphwell_Process)->Unit(benchmark::kMillisecond)->UseRealTime();

} // namespace

int main(int argc, char** argv) {
    std::filesystem::create_directories(kDirectory);
    std::ofstream(kPDF, std::ios::binary) << MakePDF();
    MakeDOCX();
    benchmark::AddCustomContext("pdf_bytes", std::to_string(std::filesystem::file_size(kPDF)));
    benchmark::AddCustomContext("docx_bytes", std::to_string(std::filesystem::file_size(kDOCX)));
    benchmark::Initialize(&argc, argv);
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    std::filesystem::remove_all(kDirectory);
    return 0;
}
