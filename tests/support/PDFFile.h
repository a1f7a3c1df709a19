// PDF files assembled from their objects, for the document readers' tests and benchmarks.
#pragma once

#include <cstdio>
#include <string>
#include <vector>

namespace glyphwell::testing {

/// A PDF made of `objects` (object 1 the catalog) with a correct cross-reference table.
inline std::string PDFFromObjects(const std::vector<std::string>& objects) {
    std::string pdf = "%PDF-1.7\n";
    std::vector<size_t> offsets;
    for (size_t i = 0; i < objects.size(); ++i) {
        offsets.push_back(pdf.size());
        pdf += std::to_string(i + 1) + " 0 obj\n" + objects[i] + "\nendobj\n";
    }
    const size_t xref = pdf.size();
    pdf += "xref\n0 " + std::to_string(objects.size() + 1) + "\n0000000000 65535 f \n";
    for (size_t offset : offsets) {
        char entry[21];
        snprintf(entry, sizeof entry, "%010zu 00000 n \n", offset);
        pdf += entry;
    }
    return pdf + "trailer\n<< /Size " + std::to_string(objects.size() + 1) +
           " /Root 1 0 R >>\nstartxref\n" + std::to_string(xref) + "\n%%EOF\n";
}

} // namespace glyphwell::testing
