#include "publishing/plugin/youtube_publishing_form.h"

#include "publishing/plugin/upload/video_metadata.h"
#include "publishing/publishing_agent.h"

#include <QComboBox>
#include <QHeaderView>
#include <QLineEdit>
#include <QVBoxLayout>

namespace {

ZafYouTubePublishingForm::DefaultCategoryRoutine &defaultCategoryRoutine()
{
    static ZafYouTubePublishingForm::DefaultCategoryRoutine routine;
    return routine;
}

const char *const kPrivacyStatuses[] = {"private", "unlisted", "public"};

} // namespace

ZafYouTubeTextCell::ZafYouTubeTextCell(QWidget *parent) : QPlainTextEdit(parent)
{
    setTabChangesFocus(true);
}

ZafYouTubeFormTable::ZafYouTubeFormTable(QWidget *parent) : QTableWidget(RowCount, 1, parent)
{
    setObjectName(QString::fromLatin1(kZafFormTableProperty));
    horizontalHeader()->setVisible(false);
    horizontalHeader()->setStretchLastSection(true);
    setVerticalHeaderLabels({tr("Title"), tr("Description"), tr("Category"), tr("Privacy")});
    setSelectionMode(QAbstractItemView::NoSelection);
    setRowHeight(DescriptionRow, 96);
}

QObject *ZafYouTubeFormTable::cellForRowInSection(int row, int section) const
{
    if (section != 0 || row < 0 || row >= rowCount())
        return nullptr;
    return cellWidget(row, 0);
}

ZafYouTubeCategoryPicker::ZafYouTubeCategoryPicker(QWidget *parent) : QListWidget(parent)
{
    setObjectName(QString::fromLatin1(kZafFormPickerProperty));
    setSelectionMode(QAbstractItemView::SingleSelection);
}

void ZafYouTubeCategoryPicker::selectRowInComponentAnimated(int row, int component, bool)
{
    if (component != 0 || row < 0 || row >= count())
        return;
    setCurrentRow(row);
    scrollToItem(item(row));
}

int ZafYouTubeCategoryPicker::selectedRowInComponent(int component) const
{
    return component == 0 ? currentRow() : -1;
}

ZafYouTubePublishingForm::ZafYouTubePublishingForm(QObject *parent) : zaf::ui::ViewController(parent)
{
    for (const zaf::publishing::VideoCategory &category : zaf::publishing::assignableCategories()) {
        QVariantMap entry;
        entry.insert(QLatin1String(kZafPublishingCategoryIdKey), category.id);
        entry.insert(QLatin1String(kZafPublishingCategoryLabelKey), category.label);
        m_categories.append(entry);
    }
}

ZafYouTubePublishingForm::~ZafYouTubePublishingForm() = default;

void ZafYouTubePublishingForm::setDefaultCategoryRoutine(DefaultCategoryRoutine routine)
{
    defaultCategoryRoutine() = std::move(routine);
}

void ZafYouTubePublishingForm::loadView()
{
    auto *view = new QWidget;
    auto *layout = new QVBoxLayout(view);

    m_table = new ZafYouTubeFormTable(view);
    m_titleField = new QLineEdit(m_table);
    m_titleField->setPlaceholderText(tr("Title"));
    m_table->setCellWidget(ZafYouTubeFormTable::TitleRow, 0, m_titleField);
    m_descriptionCell = new ZafYouTubeTextCell(m_table);
    m_descriptionCell->setPlaceholderText(tr("Description"));
    m_table->setCellWidget(ZafYouTubeFormTable::DescriptionRow, 0, m_descriptionCell);
    m_categoryCell = new ZafYouTubeCategoryCell(m_table);
    m_table->setCellWidget(ZafYouTubeFormTable::CategoryRow, 0, m_categoryCell);
    m_privacy = new QComboBox(m_table);
    m_privacy->addItem(tr("Private"), QString::fromLatin1(kPrivacyStatuses[0]));
    m_privacy->addItem(tr("Unlisted"), QString::fromLatin1(kPrivacyStatuses[1]));
    m_privacy->addItem(tr("Public"), QString::fromLatin1(kPrivacyStatuses[2]));
    m_table->setCellWidget(ZafYouTubeFormTable::PrivacyRow, 0, m_privacy);
    // The table is as tall as its rows; the picker below takes the rest of the form.
    m_table->setVerticalScrollBarPolicy(Qt::ScrollBarAlwaysOff);
    m_table->setFixedHeight(m_table->verticalHeader()->length() + 2 * m_table->frameWidth());
    layout->addWidget(m_table);

    m_picker = new ZafYouTubeCategoryPicker(view);
    layout->addWidget(m_picker, 1);
    setCategories(m_categories);
    connect(m_picker.data(), &QListWidget::currentRowChanged, this, &ZafYouTubePublishingForm::pickerRowChanged);

    setView(view);
}

void ZafYouTubePublishingForm::viewDidLoad()
{
    _selectComedyPickerRow();
}

void ZafYouTubePublishingForm::setCategories(const QVariantList &categories)
{
    m_categories = categories;
    if (!m_picker)
        return;
    const QSignalBlocker blocker(m_picker.data());
    m_picker->clear();
    for (const QVariant &entry : m_categories)
        m_picker->addItem(entry.toMap().value(QLatin1String(kZafPublishingCategoryLabelKey)).toString());
}

void ZafYouTubePublishingForm::_selectComedyPickerRow()
{
    // Copied: the routine may replace the hook while it runs.
    const DefaultCategoryRoutine routine = defaultCategoryRoutine();
    if (routine)
        routine(this);
    else
        selectDefaultCategory();
}

void ZafYouTubePublishingForm::selectDefaultCategory()
{
    for (int row = 0; row < m_categories.size(); ++row) {
        const QVariantMap entry = m_categories.at(row).toMap();
        if (entry.value(QLatin1String(kZafPublishingCategoryIdKey)).toString() != m_defaultCategory)
            continue;
        if (m_categoryCell)
            m_categoryCell->setCategoryString(entry.value(QLatin1String(kZafPublishingCategoryLabelKey)).toString());
        if (m_picker)
            m_picker->selectRowInComponentAnimated(row, 0, false);
        return;
    }
}

void ZafYouTubePublishingForm::pickerRowChanged(int row)
{
    if (row < 0 || row >= m_categories.size() || !m_categoryCell)
        return;
    m_categoryCell->setCategoryString(
        m_categories.at(row).toMap().value(QLatin1String(kZafPublishingCategoryLabelKey)).toString());
}

QString ZafYouTubePublishingForm::title() const
{
    return m_titleField ? m_titleField->text() : QString();
}

void ZafYouTubePublishingForm::setTitle(const QString &title)
{
    view();
    m_titleField->setText(title);
}

QString ZafYouTubePublishingForm::description() const
{
    return m_descriptionCell ? m_descriptionCell->value() : QString();
}

QString ZafYouTubePublishingForm::categoryId() const
{
    const int row = m_picker ? m_picker->currentRow() : -1;
    if (row >= 0 && row < m_categories.size())
        return m_categories.at(row).toMap().value(QLatin1String(kZafPublishingCategoryIdKey)).toString();
    return m_defaultCategory;
}

QString ZafYouTubePublishingForm::privacyStatus() const
{
    return m_privacy ? m_privacy->currentData().toString() : QString::fromLatin1(kPrivacyStatuses[0]);
}

void ZafYouTubePublishingForm::setPrivacyStatus(const QString &status)
{
    view();
    const int index = m_privacy->findData(zaf::publishing::VideoMetadata::normalisePrivacyStatus(status));
    if (index >= 0)
        m_privacy->setCurrentIndex(index);
}

void ZafYouTubePublishingForm::endEditing()
{
    if (!isViewLoaded())
        return;
    QWidget *focus = view()->focusWidget();
    if (focus)
        focus->clearFocus();
}
