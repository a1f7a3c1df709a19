// Loading the downloadable font catalog: time, heap and resident memory for a generated catalog
// of a given number of assets, read through QZCurrentDownloadableFontCatalog as the agent does.
//
//   catalog_bench <assets> [DIR [question]]
//
// With DIR, the catalog and the cache stay there between runs: the first run compiles the
// catalog's index (the compile time), the next ones map it. With "question", the load is what a
// download question does (QZCurrentDownloadableFontCatalogFor one font) instead of the whole
// merged catalog.
//
// prints one line: the file's size, whether the index was compiled or mapped, the load time (wall
// clock and CPU), the heap bytes the loaded
// catalog keeps and the heap's peak during the load (every malloc of the process is counted,
// through the wrappers below), and the resident set's peak and lasting growth (VmHWM reset before
// the load; VmRSS after a malloc_trim). Run it once per process: the figures are the process's own.
#include <QDir>
#include <QFile>
#include <QFileInfo>
#include <QTemporaryDir>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <malloc.h>
#include <random>
#include <string>
#include <time.h>

#include "desktop/QZCatalogIndex.h"
#include "desktop/QZCatalogSources.h"
#include "desktop/QZDownloadableFontCatalog.h"

extern "C" {
void* __libc_malloc(size_t);
void* __libc_calloc(size_t, size_t);
void* __libc_realloc(void*, size_t);
void* __libc_memalign(size_t, size_t);
void __libc_free(void*);
}

namespace {

std::atomic<int64_t> gLive{0};
std::atomic<int64_t> gPeak{0};

void Count(void* pointer, int64_t sign) {
    if (!pointer)
        return;
    const int64_t live = gLive.fetch_add(sign * int64_t(malloc_usable_size(pointer))) +
                         sign * int64_t(malloc_usable_size(pointer));
    int64_t peak = gPeak.load();
    while (live > peak && !gPeak.compare_exchange_weak(peak, live)) {
    }
}

} // namespace

// Every allocation of the process goes through these, so the counts see Qt, the JSON parser and
// the standard library alike.
extern "C" void* malloc(size_t size) {
    void* pointer = __libc_malloc(size);
    Count(pointer, 1);
    return pointer;
}
extern "C" void* calloc(size_t count, size_t size) {
    void* pointer = __libc_calloc(count, size);
    Count(pointer, 1);
    return pointer;
}
extern "C" void* realloc(void* old, size_t size) {
    Count(old, -1);
    void* pointer = __libc_realloc(old, size);
    Count(pointer ? pointer : (size ? old : nullptr), 1);
    return pointer;
}
extern "C" void free(void* pointer) {
    Count(pointer, -1);
    __libc_free(pointer);
}
extern "C" void* memalign(size_t alignment, size_t size) {
    void* pointer = __libc_memalign(alignment, size);
    Count(pointer, 1);
    return pointer;
}
extern "C" void* aligned_alloc(size_t alignment, size_t size) {
    return memalign(alignment, size);
}
extern "C" int posix_memalign(void** result, size_t alignment, size_t size) {
    *result = memalign(alignment, size);
    return *result ? 0 : ENOMEM;
}

namespace {

/// A catalog of `count` assets shaped like a real one: two fonts per asset, each with a family
/// and two localized family names.
std::string GenerateCatalog(size_t count) {
    std::mt19937_64 random(42);
    std::string text = "{\"assets\": [\n";
    for (size_t i = 0; i < count; ++i) {
        char sha[65];
        for (int j = 0; j < 64; ++j)
            sha[j] = "0123456789abcdef"[random() % 16];
        sha[64] = 0;
        const std::string n = std::to_string(i);
        const std::string family = "Example Family " + n;
        text += (i ? ",\n" : "") + std::string("{\"LocalID\": \"com.example.fonts.family") + n +
                "\", \"url\": \"https://fonts.example.com/downloads/family" + n + "/ExampleFamily" +
                n + ".ttc\", \"size\": " + std::to_string(100000 + i) + ", \"sha256\": \"" + sha +
                "\", \"fonts\": [";
        for (const char* style : {"Regular", "Bold"})
            text += std::string(style[0] == 'B' ? ", " : "") +
                    "{\"postScriptName\": \"ExampleFamily" + n + "-" + style +
                    "\", \"family\": \"" + family +
                    "\", \"localizedFamilyNames\": {\"de\": \"Beispielfamilie " + n +
                    "\", \"fr\": \"Famille exemple " + n + "\"}}";
        text += "]}";
    }
    return text + "\n]}\n";
}

/// A "Vm...:" figure of /proc/self/status in bytes.
int64_t StatusBytes(const char* field) {
    std::ifstream status("/proc/self/status");
    std::string line;
    while (std::getline(status, line))
        if (line.rfind(field, 0) == 0)
            return std::atoll(line.c_str() + std::strlen(field)) * 1024;
    return -1;
}

/// CPU time of the process so far (user and system), which a busy machine disturbs less than
/// wall-clock time.
double CPUMilliseconds() {
    timespec now{};
    clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &now);
    return double(now.tv_sec) * 1e3 + double(now.tv_nsec) / 1e6;
}

} // namespace

int main(int argc, char** argv) {
    const size_t count = argc > 1 ? std::strtoull(argv[1], nullptr, 10) : 1000;
    QTemporaryDir temporary;
    const QString home = argc > 2 ? QString::fromLocal8Bit(argv[2]) : temporary.path();
    qputenv("XDG_DATA_HOME", home.toUtf8());
    qputenv("XDG_DATA_DIRS", (home + "/none").toUtf8());
    qputenv("XDG_CACHE_HOME", (home + "/cache").toUtf8());
    qputenv("XDG_CONFIG_HOME", (home + "/config").toUtf8());
    const std::string path = (home + "/glyphwell/downloadable-fonts.json").toStdString();
    if (!QFile::exists(QString::fromStdString(path))) {
        QDir().mkpath(home + "/glyphwell");
        std::ofstream(path) << GenerateCatalog(count);
    }
    const int64_t fileSize = int64_t(QFileInfo(QString::fromStdString(path)).size());
    const bool indexed = QFile::exists(QString::fromStdString(QZCatalogIndexPath(path)));
    malloc_trim(0);
    std::ofstream("/proc/self/clear_refs") << "5"; // resets VmHWM to the current VmRSS
    const int64_t rssBefore = StatusBytes("VmRSS:");
    const int64_t heapBefore = gLive.load();
    gPeak.store(heapBefore);

    const auto start = std::chrono::steady_clock::now();
    const double cpuStart = CPUMilliseconds();
    const bool question = argc > 3 && std::strcmp(argv[3], "question") == 0;
    const auto catalog = question ? QZCurrentDownloadableFontCatalogFor({"ExampleFamily0-Bold"})
                                  : QZCurrentDownloadableFontCatalog();
    const double cpu = CPUMilliseconds() - cpuStart;
    const double milliseconds =
        std::chrono::duration<double, std::milli>(std::chrono::steady_clock::now() - start).count();

    const int64_t heapKept = gLive.load() - heapBefore;
    const int64_t heapPeak = gPeak.load() - heapBefore;
    const int64_t rssPeak = StatusBytes("VmHWM:") - rssBefore;
    malloc_trim(0);
    const int64_t rssKept = StatusBytes("VmRSS:") - rssBefore;
    std::printf("assets %zu (loaded %zu)  file %lld B  index %s  load %.1f ms (CPU %.1f ms)  "
                "heap kept %lld "
                "B (%.2fx)  "
                "heap peak %lld B (%.2fx)  RSS peak +%lld B (%.2fx)  RSS kept +%lld B (%.2fx)\n",
                count, catalog->assets.size(), (long long)fileSize, indexed ? "mapped" : "compiled",
                milliseconds, cpu, (long long)heapKept, double(heapKept) / double(fileSize),
                (long long)heapPeak, double(heapPeak) / double(fileSize), (long long)rssPeak,
                double(rssPeak) / double(fileSize), (long long)rssKept,
                double(rssKept) / double(fileSize));
    return catalog->assets.size() == (question ? 1 : count) ? 0 : 1;
}
