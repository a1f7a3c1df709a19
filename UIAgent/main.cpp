// GlyphwellUIAgent: serves the agent's local message port on the Qt event loop, asks the user the
// questions that requests bring, and ends 10 s after its last request was answered (or when the
// session or the service manager asks it to, once no request is pending).
//
// The steps an application framework's main would take for its delegate, in order: the
// application, the controller, the end of launching (the port is created and served), the event
// loop; every request to end goes through the controller's terminate().
#include <QApplication>

#include "UIAgent/QZLocalizedString.h"
#include "UIAgent/QZQtRunLoopDriver.h"
#include "UIAgent/QZTerminationRequests.h"
#include "UIAgent/QZUIController.h"
#include "desktop/QZDownloadableFontCatalog.h"
#include "desktop/QZFontMatching.h"

int main(int argc, char** argv) {
    QApplication application(argc, argv);
    QApplication::setApplicationName(QStringLiteral("GlyphwellUIAgent"));
    QApplication::setOrganizationDomain(QStringLiteral("glyphwell.org"));
    // What compositors and task switchers call the agent, with the desktop entry's icon.
    QApplication::setApplicationDisplayName(QStringLiteral("Glyphwell"));
    QApplication::setDesktopFileName(QStringLiteral("org.glyphwell.Glyphwell.GlyphwellUIAgent"));
    // Alerts come and go; the agent's life is the controller's business.
    QApplication::setQuitOnLastWindowClosed(false);
    QZInstallTranslations();
    // Fonts that are installed already are never offered for download.
    QZSetInstalledFontCheck(QZIsFontInstalled);

    QZQtRunLoopDriver driver;
    glyphwell::SetRunLoopDriver(&driver);

    int status = 0;
    {
        QZUIController controller;
        QZTerminationRequests requests;
        QObject::connect(&requests, &QZTerminationRequests::terminationRequested, &controller,
                         &QZUIController::terminate);
        // Queued: the loop ends on its next turn, after whatever emitted the signal has returned.
        QObject::connect(
            &controller, &QZUIController::terminationAccepted, &application,
            [] { QCoreApplication::exit(0); }, Qt::QueuedConnection);

        controller.applicationWillFinishLaunching();
        status = QApplication::exec();
    }
    glyphwell::SetRunLoopDriver(nullptr);
    return status;
}
