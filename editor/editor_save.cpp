// Save and done: the save mixes the current movie's audio, puts the result into the video library
// and finishes; done finishes at once. Finishing hands the activity types to the delegate.
#include "editor/editor.h"

#include "media/audio_mix_utility.h"
#include "platform/dispatch.h"
#include "platform/log.h"
#include "platform/photos/photo_library.h"
#include "tempstore/temp_store.h"

using namespace zaf::photos;

void ZafVideoEditorViewController::saveAction()
{
    // Nothing to save of a movie that cannot be played (the Save item is disabled; this is Ctrl+S).
    if (m_shareSheetUp || m_movieUnplayable)
        return;
    zaf::log::notice(lcEditor(), QStringLiteral("saveAction"));
    m_activityTypes.append(QString::fromLatin1(ZafActivityTypeSaveToPhotoLibrary));
    if (m_trimming) {
        trimVideo();
        return;
    }

    QPointer<ZafVideoEditorViewController> weakSelf(this);
    const QUrl unmixed = m_videoURL;
    // Runs on the mix's export thread.
    // The editor keeps the mix's export so that its destructor can stop it before emptying the
    // temporary directory the mix writes into.
    m_mixSession = ZafAudioMixUtility::mixAudioForMovieWithCompletionHandler(unmixed, [weakSelf, unmixed](const QUrl &mixed,
                                                                                          const zaf::OptionalError &error) {
        QUrl toSave = mixed;
        if (error) {
            zaf::log::error(lcEditor(), QStringLiteral("Error Mixing video Audio tracks"));
            // Without a mixed file the movie is saved as it is, so the user's work still reaches
            // the library; nothing is removed.
            toSave = unmixed;
        } else {
            zaf::dispatch::main([weakSelf, mixed] {
                if (weakSelf)
                    weakSelf->m_videoURL = mixed;
            });
        }
        PhotoLibrary::sharedPhotoLibrary().performChanges(
            [toSave](PhotoLibraryChangeRequest &request) { request.creationRequestForAssetFromVideoAtFileURL(toSave); },
            // Runs on the library's queue.
            [weakSelf, unmixed, toSave](bool, const zaf::OptionalError &libraryError) {
                if (libraryError) {
                    zaf::log::error(lcEditor(),
                                    QStringLiteral("Error writing video to camera roll: %1").arg(libraryError->code));
                } else if (toSave != unmixed) {
                    // The movie before mixing goes only once its mixed copy is safely in the library.
                    ZafTempStore::defaultStore()._srRemoveFile(unmixed, [](const zaf::OptionalError &) {});
                }
                // The rest of the editor lives on the main thread; the end of the save goes there.
                zaf::dispatch::main([weakSelf] {
                    if (weakSelf)
                        weakSelf->doneAction();
                });
            });
    });
}

void ZafVideoEditorViewController::doneAction()
{
    if (m_shareSheetUp)
        return;
    m_mvPlayer->pause();
    finishWithDelegate();
}

void ZafVideoEditorViewController::finishWithDelegate()
{
    if (auto *delegate = qobject_cast<ZafVideoEditorViewControllerDelegate *>(m_delegate.data()))
        delegate->videoEditorDidFinishWithActivityTypes(this, m_activityTypes);
}
