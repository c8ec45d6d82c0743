#pragma once

// The coordinator handed to viewWillTransitionToSize: blocks to run alongside the size change, and
// completion blocks after it. On the desktop the window has already taken its new size when the
// callback runs, so an alongside block runs at once; completions run when the transition ends.

#include <QSizeF>

#include <functional>
#include <vector>

namespace zaf::ui {

class TransitionCoordinator {
public:
    using Block = std::function<void()>;
    explicit TransitionCoordinator(QSizeF targetSize) : m_targetSize(targetSize) {}

    // Runs alongside at once and keeps completion for complete().
    void animateAlongsideTransition(const Block &alongside, const Block &completion);
    QSizeF targetSize() const { return m_targetSize; }
    // Runs the completion blocks (the owner of the transition calls it once).
    void complete();

private:
    QSizeF m_targetSize;
    std::vector<Block> m_completions;
};

} // namespace zaf::ui
