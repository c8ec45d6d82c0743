#pragma once

// A plain view that can take keyboard focus (the first responder of the extension's window).

#include <QWidget>

class ZafVideoEditorExtensionViewControllerFocusView : public QWidget {
    Q_OBJECT
public:
    explicit ZafVideoEditorExtensionViewControllerFocusView(QWidget *parent = nullptr)
        : QWidget(parent)
    {
        setFocusPolicy(Qt::StrongFocus);
    }
    bool canBecomeFirstResponder() const { return true; }
};
