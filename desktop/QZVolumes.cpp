#include "desktop/QZVolumes.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>
#include <QList>
#include <sys/stat.h>
#include <sys/sysmacros.h>

namespace {

/// mountinfo escapes space, tab, newline and backslash as a backslash and three octal digits.
QString UnescapeOctal(const QByteArray& field) {
    QByteArray bytes;
    bytes.reserve(field.size());
    for (qsizetype i = 0; i < field.size(); ++i) {
        if (field[i] == '\\' && i + 3 < field.size()) {
            const QByteArray digits = field.mid(i + 1, 3);
            bool ok = digits.size() == 3;
            for (char d : digits)
                ok = ok && d >= '0' && d <= '7';
            if (ok) {
                bytes += char(digits.toInt(nullptr, 8));
                i += 3;
                continue;
            }
        }
        bytes += field[i];
    }
    return QString::fromUtf8(bytes);
}

/// udev writes bytes outside its safe set, spaces included, as \xHH in link names.
QString UnescapeHex(const QString& name) {
    const QByteArray field = QFile::encodeName(name);
    QByteArray bytes;
    bytes.reserve(field.size());
    for (qsizetype i = 0; i < field.size(); ++i) {
        if (field[i] == '\\' && i + 3 < field.size() && field[i + 1] == 'x') {
            bool ok = false;
            const int value = field.mid(i + 2, 2).toInt(&ok, 16);
            if (ok) {
                bytes += char(value);
                i += 3;
                continue;
            }
        }
        bytes += field[i];
    }
    return QString::fromUtf8(bytes);
}

bool IsPrefixPath(const QString& mountPoint, const QString& path) {
    if (mountPoint == QStringLiteral("/"))
        return path.startsWith(u'/');
    return path == mountPoint ||
           (path.startsWith(mountPoint) && path.at(mountPoint.size()) == u'/');
}

} // namespace

std::vector<QZMountEntry> QZParseMountInfo(const QByteArray& text) {
    // id parent major:minor root mount-point options [optional fields...] - type source options
    std::vector<QZMountEntry> mounts;
    for (const QByteArray& line : text.split('\n')) {
        const QList<QByteArray> fields = line.split(' ');
        const qsizetype separator = fields.indexOf(QByteArray("-"));
        if (fields.size() < 6 || separator < 6 || separator + 2 >= fields.size())
            continue;
        QZMountEntry entry;
        bool ok = false;
        entry.mountId = fields[0].toInt(&ok);
        if (!ok)
            continue;
        const QList<QByteArray> numbers = fields[2].split(':');
        bool majorOk = false, minorOk = false;
        if (numbers.size() != 2)
            continue;
        const unsigned major = numbers[0].toUInt(&majorOk);
        const unsigned minor = numbers[1].toUInt(&minorOk);
        if (!majorOk || !minorOk)
            continue;
        entry.device = makedev(major, minor);
        entry.mountPoint = UnescapeOctal(fields[4]);
        if (!entry.mountPoint.startsWith(u'/'))
            continue;
        entry.fileSystemType = UnescapeOctal(fields[separator + 1]);
        entry.source = UnescapeOctal(fields[separator + 2]);
        mounts.push_back(std::move(entry));
    }
    return mounts;
}

std::vector<QZMountEntry> QZReadMountInfo(const QString& mountInfoPath) {
    QFile file(mountInfoPath.isEmpty() ? QStringLiteral("/proc/self/mountinfo") : mountInfoPath);
    if (!file.open(QIODevice::ReadOnly))
        return {};
    // The kernel reports a size of 0 for the table: read to the end.
    return QZParseMountInfo(file.readAll());
}

std::optional<QZMountEntry> QZMountForCanonicalPath(const QString& canonicalPath,
                                                    const std::vector<QZMountEntry>& mounts) {
    const QZMountEntry* best = nullptr;
    for (const QZMountEntry& mount : mounts) {
        if (!IsPrefixPath(mount.mountPoint, canonicalPath))
            continue;
        // ">=": of mounts stacked on one point, the later one is on top.
        if (!best || mount.mountPoint.size() >= best->mountPoint.size())
            best = &mount;
    }
    if (!best)
        return std::nullopt;
    return *best;
}

QString QZVolumeLabel(const QZMountEntry& mount, const QString& byLabelDirectory) {
    const QDir directory(byLabelDirectory.isEmpty() ? QStringLiteral("/dev/disk/by-label")
                                                    : byLabelDirectory);
    const QString source = QFileInfo(mount.source).canonicalFilePath();
    for (const QFileInfo& link :
         directory.entryInfoList(QDir::AllEntries | QDir::System | QDir::NoDotAndDotDot)) {
        const QString target = link.canonicalFilePath();
        if (target.isEmpty())
            continue;
        bool matches = !source.isEmpty() && target == source;
        // Device paths differ between tools (/dev/mapper/x and /dev/dm-0): compare numbers.
        struct stat status;
        if (!matches && stat(QFile::encodeName(target).constData(), &status) == 0 &&
            S_ISBLK(status.st_mode))
            matches = status.st_rdev == mount.device;
        if (matches)
            return UnescapeHex(link.fileName());
    }
    return QString();
}

QString QZVolumeName(const QZMountEntry& mount, const QString& byLabelDirectory) {
    const QString label = QZVolumeLabel(mount, byLabelDirectory);
    if (!label.isEmpty())
        return label;
    if (mount.mountPoint == QStringLiteral("/"))
        return mount.mountPoint;
    return mount.mountPoint.section(u'/', -1);
}

QString QZNonRootVolumeName(const QString& path, const QString& mountInfoPath,
                            const QString& byLabelDirectory) {
    const QString canonical = QFileInfo(path).canonicalFilePath();
    if (canonical.isEmpty())
        return QString();
    const std::vector<QZMountEntry> mounts = QZReadMountInfo(mountInfoPath);
    const auto volume = QZMountForCanonicalPath(canonical, mounts);
    const auto root = QZMountForCanonicalPath(QStringLiteral("/"), mounts);
    // Compared by file system, not by mount: a bind mount of the root file system, or a
    // subvolume of it, is still the system's volume.
    if (!volume || !root || volume->device == root->device)
        return QString();
    return QZVolumeName(*volume, byLabelDirectory);
}
