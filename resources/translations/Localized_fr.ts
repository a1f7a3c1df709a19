<?xml version="1.0" encoding="utf-8"?>
<!DOCTYPE TS>
<TS version="2.1" language="fr_FR" sourcelanguage="en_US">
<context>
    <name>Localized</name>
    <message>
        <source>QZ_HEADLINE_FONT</source>
        <extracomment>Headline of the font-use alert. %1: application name, %2: font name.</extracomment>
        <translation>%1 souhaite utiliser la police « %2 », qui n’est pas installée.</translation>
    </message>
    <message>
        <source>QZ_HEADLINE_FONT_VOLUME</source>
        <extracomment>Headline of the font-use alert when the font file lies on another volume. %1: application name, %2: font name, %3: volume name.</extracomment>
        <translation>%1 souhaite utiliser la police « %2 », qui n’est pas installée mais a été trouvée sur le volume « %3 ».</translation>
    </message>
    <message>
        <source>QZ_DETAIL_FONT_NOT_INSTALLED</source>
        <extracomment>Detail text of the font-use alert.</extracomment>
        <translation>La police n’est pas installée, mais un fichier de police qui la contient a été trouvé. Si vous l’autorisez, l’application pourra utiliser cette police.</translation>
    </message>
    <message>
        <source>QZ_BUTTON_ALLOW</source>
        <extracomment>Button: let the application use the font.</extracomment>
        <translation>Autoriser</translation>
    </message>
    <message>
        <source>QZ_BUTTON_DISALLOW</source>
        <extracomment>Button: do not let the application use the font.</extracomment>
        <translation>Ne pas autoriser</translation>
    </message>
    <message>
        <source>QZ_BUTTON_SHOW_IN_FINDER</source>
        <extracomment>Button: show the font files in the file manager; the question stays.</extracomment>
        <translation>Afficher dans le gestionnaire de fichiers</translation>
    </message>
    <message>
        <source>QZ_DO_NOT_WARN_APPLICATION</source>
        <extracomment>Checkbox of the font-use alert. %1: application name.</extracomment>
        <translation>Ne plus demander pour %1</translation>
    </message>
    <message>
        <source>QZ_AUTO_ACTIVATION_HELP_ANCHOR</source>
        <extracomment>Not shown: the anchor of the help page section opened by the alert's help button. Keep it as it is.</extracomment>
        <translation>auto-activation</translation>
    </message>
    <message>
        <source>QZ_CURRENT_APPLICATION</source>
        <extracomment>Stands for the application name when none is known; used inside the other texts.</extracomment>
        <translation>L’application actuelle</translation>
    </message>
    <message>
        <source>QZ_HEADLINE_NEEDS_TO_DOWNLOAD_FONT_NAME</source>
        <extracomment>Headline of the download alert for one font. %1: application name, %2: font name.</extracomment>
        <translation>%1 doit télécharger la police « %2 ».</translation>
    </message>
    <message>
        <source>QZ_HEADLINE_NEEDS_TO_DOWNLOAD</source>
        <extracomment>Headline of the download alert for several fonts. %1: application name.</extracomment>
        <translation>%1 doit télécharger des polices.</translation>
    </message>
    <message>
        <source>QZ_DETAIL_FONT_SIZE</source>
        <extracomment>Detail text of the download alert for one font. %1: font name, %2: size (such as 12.3 MB).</extracomment>
        <translation>La police « %1 » occupe %2. Voulez-vous la télécharger ?</translation>
    </message>
    <message>
        <source>QZ_DETAIL_DOWNLOAD_SIZE</source>
        <extracomment>Detail text of the download alert for several fonts. %1: total size (such as 12.3 MB).</extracomment>
        <translation>Le téléchargement représente %1 au total. Voulez-vous télécharger les polices ?</translation>
    </message>
    <message>
        <source>Skip</source>
        <extracomment>Button of the download alert: do not download.</extracomment>
        <translation>Ignorer</translation>
    </message>
    <message>
        <source>Download</source>
        <extracomment>Button of the download alert: download the fonts.</extracomment>
        <translation>Télécharger</translation>
    </message>
    <message>
        <source>QZ_PREPARING_TO_DOWNLOAD</source>
        <extracomment>Status line of the download window before the first font.</extracomment>
        <translation>Préparation du téléchargement…</translation>
    </message>
    <message>
        <source>QZ_PREPARING_TO_DOWNLOAD_FONT</source>
        <extracomment>Status line of the download window. %1: font name.</extracomment>
        <translation>Préparation du téléchargement de « %1 »…</translation>
    </message>
    <message>
        <source>QZ_DOWNLOADING_FONT</source>
        <extracomment>Status line of the download window. %1: font name.</extracomment>
        <translation>Téléchargement de « %1 »…</translation>
    </message>
    <message>
        <source>QZ_DOWNLOADING_FONTS</source>
        <extracomment>Status line of the download window when the font being downloaded has no name.</extracomment>
        <translation>Téléchargement des polices…</translation>
    </message>
    <message>
        <source>QZ_DOWNLOAD_WINDOW_TITLE</source>
        <extracomment>Title of the download window.</extracomment>
        <translation>Téléchargement de polices</translation>
    </message>
    <message>
        <source>%1$@ of %2$@</source>
        <extracomment>Size line of the download window. %1: size downloaded so far, %2: total size.</extracomment>
        <translation>%1 sur %2</translation>
    </message>
    <message>
        <source>Continue Download</source>
        <extracomment>Button: go on with the download after an error or while offline.</extracomment>
        <translation>Poursuivre le téléchargement</translation>
    </message>
    <message>
        <source>Cancel</source>
        <extracomment>Button: stop the download.</extracomment>
        <translation>Annuler</translation>
    </message>
    <message>
        <source>Network is not connected.</source>
        <extracomment>Headline of the offline alert.</extracomment>
        <translation>Le réseau n’est pas connecté.</translation>
    </message>
    <message>
        <source>You are not connected to the Internet. Do you want to cancel downloading?</source>
        <extracomment>Detail text of the offline alert; its default button is Cancel.</extracomment>
        <translation>Vous n’êtes pas connecté à Internet. Voulez-vous annuler le téléchargement ?</translation>
    </message>
    <message>
        <source>This question closes without an answer in %@.</source>
        <extracomment>Countdown under the font-use alert. %1: the time left, such as 1:59.</extracomment>
        <translation>Cette question se fermera sans réponse dans %1.</translation>
    </message>
    <message>
        <source>Help</source>
        <extracomment>Title of the help window of the font-use alert.</extracomment>
        <translation>Aide</translation>
    </message>
    <message>
        <source>QZ_AUTO_ACTIVATION_TITLE</source>
        <extracomment>Title of the alert that asks whether an application may use a font.</extracomment>
        <translation>Utiliser la police ?</translation>
    </message>
    <message>
        <source>QZ_DOWNLOAD_CONFIRMATION_TITLE</source>
        <extracomment>Title of the alert that asks whether fonts may be downloaded.</extracomment>
        <translation>Télécharger des polices ?</translation>
    </message>
    <message>
        <source>QZ_NETWORK_ALERT_TITLE</source>
        <extracomment>Title of the alert shown when the network is not connected.</extracomment>
        <translation>Aucune connexion réseau</translation>
    </message>
    <message>
        <source>QZ_DOWNLOAD_ERROR_TITLE</source>
        <extracomment>Title of the alert shown when a font download failed.</extracomment>
        <translation>Échec du téléchargement de polices</translation>
    </message>
    <message>
        <source>QZ_ERROR_DOMAIN_CODE</source>
        <extracomment>Headline of the download failure alert when the failure has no description: %1 is the error domain, %2 the error code.</extracomment>
        <translation>Erreur %2 de %1.</translation>
    </message>
    <message>
        <source>QZ_DOWNLOAD_PROGRESS_NAME</source>
        <extracomment>Accessible name of the download window's progress bar.</extracomment>
        <translation>Progression du téléchargement</translation>
    </message>
</context>
<context>
    <name>QZFontService</name>
    <message>
        <source>The font “%1” cannot be downloaded.</source>
        <extracomment>Download failure alert. Headline of the download failure alert. %1: the font's PostScript name.</extracomment>
        <translation>Impossible de télécharger la police « %1 ».</translation>
    </message>
    <message>
        <source>No downloadable font has this name.</source>
        <extracomment>Download failure alert. Reason: no catalog offers the font.</extracomment>
        <translation>Aucune police téléchargeable ne porte ce nom.</translation>
    </message>
    <message>
        <source>The downloaded font file does not hold this font.</source>
        <extracomment>Download failure alert. Reason: the asset was installed but does not contain the requested font.</extracomment>
        <translation>Le fichier de police téléchargé ne contient pas cette police.</translation>
    </message>
</context>
<context>
    <name>QZFontDownloader</name>
    <message>
        <source>The server offers %1 bytes, but the font should have %2 bytes.</source>
        <extracomment>Download failure alert. Reason. %1: bytes the server announces, %2: bytes expected.</extracomment>
        <translation>Le serveur propose %1 octets, mais la police devrait en compter %2.</translation>
    </message>
    <message>
        <source>The server sent more than the %1 bytes of the font.</source>
        <extracomment>Download failure alert. Reason. %1: bytes expected.</extracomment>
        <translation>Le serveur a envoyé plus que les %1 octets de la police.</translation>
    </message>
    <message>
        <source>The font file cannot be written: %1</source>
        <extracomment>Download failure alert. Reason. %1: the system's error text.</extracomment>
        <translation>Impossible d’écrire le fichier de police : %1</translation>
    </message>
    <message>
        <source>The server answered with the HTTP status %1.</source>
        <extracomment>Download failure alert. Reason. %1: HTTP status code.</extracomment>
        <translation>Le serveur a répondu avec le statut HTTP %1.</translation>
    </message>
    <message>
        <source>Fonts are downloaded only from https, http and file addresses, and redirected only to https and http ones.</source>
        <extracomment>Download failure alert. Reason: the catalog's address or a redirection uses another scheme.</extracomment>
        <translation>Les polices ne sont téléchargées que depuis des adresses https, http et file, et redirigées uniquement vers des adresses https et http.</translation>
    </message>
    <message>
        <source>The connection ended after %1 of %2 bytes.</source>
        <extracomment>Download failure alert. Reason. %1: bytes received, %2: bytes expected.</extracomment>
        <translation>La connexion s’est interrompue après %1 octets sur %2.</translation>
    </message>
    <message>
        <source>The download failed: %1</source>
        <extracomment>Download failure alert. Reason. %1: the transfer library's error text.</extracomment>
        <translation>Le téléchargement a échoué : %1</translation>
    </message>
    <message>
        <source>The font folder cannot be created: %1</source>
        <extracomment>Download failure alert. Reason. %1: the system's error text.</extracomment>
        <translation>Impossible de créer le dossier des polices : %1</translation>
    </message>
    <message>
        <source>The download holds %1 bytes, but the font should have %2 bytes.</source>
        <extracomment>Download failure alert. Reason. %1: bytes received, %2: bytes expected.</extracomment>
        <translation>Le téléchargement contient %1 octets, mais la police devrait en compter %2.</translation>
    </message>
    <message>
        <source>The downloaded file is damaged: its SHA-256 checksum is not the expected one.</source>
        <extracomment>Download failure alert. Reason: checksum mismatch.</extracomment>
        <translation>Le fichier téléchargé est endommagé : sa somme de contrôle SHA-256 n’est pas celle attendue.</translation>
    </message>
    <message>
        <source>The downloaded file is not a font.</source>
        <extracomment>Download failure alert. Reason.</extracomment>
        <translation>Le fichier téléchargé n’est pas une police.</translation>
    </message>
    <message>
        <source>The server did not answer within %1 seconds.</source>
        <extracomment>Download failure alert. Reason. %1: seconds waited.</extracomment>
        <translation>Le serveur n’a pas répondu dans les %1 secondes.</translation>
    </message>
    <message>
        <source>The downloaded file does not hold the font “%1”.</source>
        <extracomment>Download failure alert. Reason. %1: the font's PostScript name.</extracomment>
        <translation>Le fichier téléchargé ne contient pas la police « %1 ».</translation>
    </message>
    <message>
        <source>The download was given up: the server sent less than %1 bytes per second over %2 seconds.</source>
        <extracomment>Download failure alert. Reason. %1: bytes per second, %2: seconds measured.</extracomment>
        <translation>Le téléchargement a été abandonné : le serveur a envoyé moins de %1 octets par seconde pendant %2 secondes.</translation>
    </message>
</context>
</TS>
