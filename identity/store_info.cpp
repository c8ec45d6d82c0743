#include "identity/store_info.h"

QVariantMap ZafStoreInfo::dictionary() const
{
    QVariantMap dictionary;
    if (m_bundleID)
        dictionary.insert(QString::fromLatin1(ZafStoreInfoBundleIDKey), *m_bundleID);
    if (m_appName)
        dictionary.insert(QString::fromLatin1(ZafStoreInfoAppNameKey), *m_appName);
    if (m_author)
        dictionary.insert(QString::fromLatin1(ZafStoreInfoAuthorKey), *m_author);
    if (m_itemURL)
        dictionary.insert(QString::fromLatin1(ZafStoreInfoItemURLKey), *m_itemURL);
    if (m_categories && !m_categories->isEmpty())
        dictionary.insert(QString::fromLatin1(ZafStoreInfoCategoriesKey), m_categories->join(QLatin1Char(',')));
    return dictionary;
}
