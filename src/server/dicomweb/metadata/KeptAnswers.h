#pragma once

#include "server/http/CacheCount.h"
#include "server/http/OpenFile.h"

#include <QByteArray>
#include <QString>

#include <atomic>
#include <memory>

namespace Kdd::DicomWeb
{

/// Answers that were expensive to make, by name, in a folder that any number of servers share. A name stands for its
/// content for ever: what changes gets another name, and what nobody asks for any more goes in time.
///
/// May be used on any thread. That something cannot be kept is no fault of any answer; it is warned about.
class KeptAnswers
{
public:
    /// Of the folder, which is made when it is needed, at most `capacity` [bytes] stays used after a clean-up; nothing is
    /// kept when that is 0.
    KeptAnswers(const QString& folder, qint64 capacity);

    /// The answer of that name; false when there is none. It stays readable when it is removed.
    bool find(const QByteArray& name, Http::FileRange& answer);

    /// How often `find` had it.
    const Http::CacheCount& count() const { return mCount; }

    /// An answer that is being made. What is not kept in the end was never there. Used by one thread at a time.
    class Draft
    {
    public:
        ~Draft();
        Draft(const Draft&) = delete;
        Draft& operator=(const Draft&) = delete;

        /// After a failure there is nothing to be kept.
        void write(const QByteArray& bytes);

        /// The whole answer is there.
        void keep();

    private:
        friend class KeptAnswers;
        Draft(KeptAnswers& answers, const QByteArray& path);

        KeptAnswers& mAnswers;
        QByteArray mPath;
        QByteArray mTemporary;
        int mFile = -1;
        qint64 mSize = 0;
    };

    /// Null when nothing can be kept. The draft must not outlive this.
    std::unique_ptr<Draft> begin(const QByteArray& name);

private:
    QByteArray pathOf(const QByteArray& name) const;
    void added(qint64 size);
    void cleanUp() const;

    QByteArray mFolder;
    qint64 mCapacity;
    Http::CacheCount mCount;
    std::atomic<qint64> mAdded;  // since the last clean-up [bytes]
};

}  // namespace Kdd::DicomWeb
