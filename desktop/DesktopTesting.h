// Hooks that tests install into desktop/ to inject faults; the product only reads them.
#pragma once

/// The file operations of the font installer (QZFontFileWriter) whose failure tests inject.
enum class QZFontFileOperation { Write, Sync, Link, Rename, Lock };

/// Makes every later call of `operation` by any font file writer fail with `error` (an errno
/// value, e.g. ENOSPC for a full disk), until it is called again with 0. Thread-safe.
void QZInjectFontFileFault(QZFontFileOperation operation, int error);
