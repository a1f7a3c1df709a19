// Volumes (mounted file systems) and their names, read from the kernel's mount table
// (/proc/self/mountinfo) and the udev label links (/dev/disk/by-label).
//
// The volume of a path is the mount whose mount point is the longest prefix of the path's
// canonical form (the last such mount in the table when several are stacked on one point). Its
// name is the file system's label when a label link leads to the mount's device, else the last
// component of its mount point ("/" for the root).
#pragma once

#include <QByteArray>
#include <QString>
#include <optional>
#include <sys/types.h>
#include <vector>

/// One line of a mountinfo table.
struct QZMountEntry {
    int mountId = 0;
    dev_t device = 0;   ///< major:minor of the file system
    QString mountPoint; ///< escapes (\040 ...) resolved
    QString fileSystemType;
    QString source; ///< the mount source (a device path, or a name such as "tmpfs")
};

/// The entries of a mountinfo table, in order. Lines that do not have the table's shape are
/// skipped.
std::vector<QZMountEntry> QZParseMountInfo(const QByteArray& text);
/// The entries of /proc/self/mountinfo, or of `mountInfoPath`; none when it cannot be read.
std::vector<QZMountEntry> QZReadMountInfo(const QString& mountInfoPath = QString());

/// The mount holding `canonicalPath` (absolute, with no "." or ".." components and no symbolic
/// links) among `mounts`; empty when none does.
std::optional<QZMountEntry> QZMountForCanonicalPath(const QString& canonicalPath,
                                                    const std::vector<QZMountEntry>& mounts);

/// The label of `mount`'s file system from the links in `byLabelDirectory`
/// (/dev/disk/by-label when empty), whose names escape bytes as \xHH; empty when none leads to
/// the mount's device.
QString QZVolumeLabel(const QZMountEntry& mount, const QString& byLabelDirectory = QString());
/// The label of `mount`, else the last component of its mount point.
QString QZVolumeName(const QZMountEntry& mount, const QString& byLabelDirectory = QString());

/// The name of the volume holding the existing file or directory `path`, or empty when that
/// volume's file system (its device number) is the root file system's, or when the path does
/// not exist or no mount holds it.
/// `mountInfoPath` and `byLabelDirectory` replace the system's tables when not empty.
QString QZNonRootVolumeName(const QString& path, const QString& mountInfoPath = QString(),
                            const QString& byLabelDirectory = QString());
