#pragma once

// The form of the YouTube publishing plug-in: title, description, category and privacy of the video.
//
// The share action reaches parts of the form by name, through the meta-object system:
//   "_table"            property (QObject*), also the table's objectName; its
//                       Q_INVOKABLE cellForRowInSection(1, 0) is the description cell, with
//                       setValue(QString) and setPlaceholderText(QString)
//   "_categories"       property: QVariantList of QVariantMap {"id", "label"}, the assignable categories
//   "_picker"           property (QObject*), also the picker's objectName;
//                       Q_INVOKABLE selectRowInComponentAnimated(int row, int component, bool animated)
//   "_defaultCategory"  property: the category id used by default ("22")
//   _categoryCell()     Q_INVOKABLE: the cell showing the chosen category, with setCategoryString(QString)
//   _selectComedyPickerRow()  Q_INVOKABLE: the default-category routine, run when the view loads.
//                       A process-wide hook (setDefaultCategoryRoutine) replaces it for every form.
// Main thread only.

#include "platform/ui/view_controller.h"

#include <QLabel>
#include <QListWidget>
#include <QPlainTextEdit>
#include <QPointer>
#include <QTableWidget>
#include <QVariantList>

#include <functional>

class QComboBox;
class QLineEdit;

// The multi-line description cell (row 1 of section 0).
class ZafYouTubeTextCell : public QPlainTextEdit {
    Q_OBJECT
public:
    explicit ZafYouTubeTextCell(QWidget *parent = nullptr);
    Q_INVOKABLE void setValue(const QString &value) { setPlainText(value); }
    Q_INVOKABLE QString value() const { return toPlainText(); }
    Q_INVOKABLE void setPlaceholderText(const QString &text) { QPlainTextEdit::setPlaceholderText(text); }
};

// The cell that shows the chosen category's label.
class ZafYouTubeCategoryCell : public QLabel {
    Q_OBJECT
public:
    explicit ZafYouTubeCategoryCell(QWidget *parent = nullptr) : QLabel(parent) {}
    Q_INVOKABLE void setCategoryString(const QString &label) { setText(label); }
    Q_INVOKABLE QString categoryString() const { return text(); }
};

// The form's table. Section 0 is the only section: title, description, category, privacy.
class ZafYouTubeFormTable : public QTableWidget {
    Q_OBJECT
public:
    enum Row { TitleRow = 0, DescriptionRow = 1, CategoryRow = 2, PrivacyRow = 3, RowCount = 4 };
    explicit ZafYouTubeFormTable(QWidget *parent = nullptr);
    // The cell widget at (row, section), or null when there is none.
    Q_INVOKABLE QObject *cellForRowInSection(int row, int section) const;
};

// The one-component category picker.
class ZafYouTubeCategoryPicker : public QListWidget {
    Q_OBJECT
public:
    explicit ZafYouTubeCategoryPicker(QWidget *parent = nullptr);
    // Selects `row` of `component` (only component 0 exists); out-of-range rows are ignored.
    Q_INVOKABLE void selectRowInComponentAnimated(int row, int component, bool animated);
    Q_INVOKABLE int selectedRowInComponent(int component) const;
};

class ZafYouTubePublishingForm : public zaf::ui::ViewController {
    Q_OBJECT
    Q_PROPERTY(QObject *_table READ tableObject)
    Q_PROPERTY(QObject *_picker READ pickerObject)
    Q_PROPERTY(QVariantList _categories READ categories WRITE setCategories)
    Q_PROPERTY(QString _defaultCategory READ defaultCategory WRITE setDefaultCategory)
public:
    using DefaultCategoryRoutine = std::function<void(ZafYouTubePublishingForm *form)>;

    explicit ZafYouTubePublishingForm(QObject *parent = nullptr);
    ~ZafYouTubePublishingForm() override;

    // Process-wide: replaces the default-category routine of every form for every later call; an
    // empty function restores the built-in routine (select "_defaultCategory").
    static void setDefaultCategoryRoutine(DefaultCategoryRoutine routine);

    void loadView() override;
    void viewDidLoad() override;

    // Null until the view is loaded.
    ZafYouTubeFormTable *table() const { return m_table; }
    ZafYouTubeCategoryPicker *picker() const { return m_picker; }
    QObject *tableObject() const { return m_table; }
    QObject *pickerObject() const { return m_picker; }

    QVariantList categories() const { return m_categories; }
    void setCategories(const QVariantList &categories);
    QString defaultCategory() const { return m_defaultCategory; }
    void setDefaultCategory(const QString &categoryId) { m_defaultCategory = categoryId; }

    Q_INVOKABLE QObject *_categoryCell() const { return m_categoryCell; }
    Q_INVOKABLE void _selectComedyPickerRow();
    // The built-in default-category routine: selects the "_defaultCategory" entry.
    void selectDefaultCategory();

    // What the person entered (the category is the picker's row, else "_defaultCategory").
    Q_INVOKABLE QString title() const;
    Q_INVOKABLE void setTitle(const QString &title);
    Q_INVOKABLE QString description() const;
    Q_INVOKABLE QString categoryId() const;
    // "private", "unlisted" or "public".
    Q_INVOKABLE QString privacyStatus() const;
    Q_INVOKABLE void setPrivacyStatus(const QString &status);

    // Ends text editing in the form (the keyboard focus leaves its fields).
    void endEditing();

private:
    void pickerRowChanged(int row);

    QPointer<ZafYouTubeFormTable> m_table;
    QPointer<ZafYouTubeCategoryPicker> m_picker;
    QPointer<QLineEdit> m_titleField;
    QPointer<ZafYouTubeTextCell> m_descriptionCell;
    QPointer<ZafYouTubeCategoryCell> m_categoryCell;
    QPointer<QComboBox> m_privacy;
    QVariantList m_categories;
    QString m_defaultCategory = QStringLiteral("22");
};
