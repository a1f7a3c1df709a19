// What assistive technologies are told about the agent's own kinds of widget, beyond what Qt
// says of them: the countdown of a question is a status region (a status bar, not a static text),
// and the help window is a document whose text can be read, not a label. The widgets are found
// by their object names.
//
// Main thread only.
#pragma once

/// Object name of a QLabel that is exposed as a status region.
inline constexpr char kQZStatusRegionObjectName[] = "statusRegion";
/// Object name of a read-only QTextBrowser that is exposed as a document.
inline constexpr char kQZDocumentObjectName[] = "helpDocument";

/// Makes queryAccessibleInterface answer as above for the widgets named so. Idempotent.
void QZInstallAccessibilityFactory();
