// A libcurl easy handle owned by one transfer, with libcurl's process-wide set-up done once
// before the first. Shared by the font downloads, the catalog refresh and the catalog tool. No Qt.
#pragma once

#include <curl/curl.h>
#include <memory>

struct QZCurlHandleCleanup {
    void operator()(CURL* easy) const { curl_easy_cleanup(easy); }
};
using QZCurlHandle = std::unique_ptr<CURL, QZCurlHandleCleanup>;

/// A new easy handle; null when libcurl cannot be set up or is out of memory.
inline QZCurlHandle QZCreateCurlHandle() {
    static const bool initialized = curl_global_init(CURL_GLOBAL_DEFAULT) == CURLE_OK;
    return QZCurlHandle(initialized ? curl_easy_init() : nullptr);
}
