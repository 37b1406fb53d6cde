// SPDX-License-Identifier: GPL-2.0-only
/*
 * TesvarKVR: the reference power-management driver.
 *
 * User space hands it the battery model record through the user-client call
 * of <linux/tesvar_kvr.h> (selector 24, "setBatteryParams") on the misc
 * device /dev/tesvar_kvr, and confirms the upload by reading the SHA-1 the
 * driver publishes in battery_model/rc_params_hash.
 *
 * On a device this driver would hand the record to the fuel gauge. This
 * reference keeps it instead, publishes its digest, and lets root read it
 * back through the node, so that the whole road from a model file to the
 * kernel can be run and checked on any machine.
 *
 * Every accepted record is kept in an object of its own with its digest and
 * its number among the accepted ones, and is never changed afterwards: an
 * upload builds a new object and publishes it in place of the old one
 * (RCU). Readers of the attributes take whatever object is published at
 * that moment, without a lock, so they never wait for an upload nor make
 * one fail; a file opened for reading holds a reference to the object
 * published when it was opened and reads that record whole, however its
 * reads are split. The digest, the count and the record therefore always
 * belong to one another.
 *
 * Uploads are serialised by a mutex of their own, held for the whole call
 * (the copy, the digest, the commit) as a device driver would hold it while
 * it writes the gauge: a second caller waits, or gets EBUSY on a
 * non-blocking file, only while another call is in progress. A call refused
 * at any step publishes nothing, so the kept record, its digest and the
 * count stay exactly as they were.
 */

#include <linux/bitops.h>
#include <linux/device.h>
#include <linux/fs.h>
#include <linux/kernel.h>
#include <linux/miscdevice.h>
#include <linux/mm.h>
#include <linux/module.h>
#include <linux/mutex.h>
#include <linux/platform_device.h>
#include <linux/rcupdate.h>
#include <linux/refcount.h>
#include <linux/slab.h>
#include <linux/string.h>
#include <linux/sysfs.h>
#include <linux/tesvar_kvr.h>
#include <linux/uaccess.h>
#include <crypto/hash.h>

#define TESVAR_KVR_NAME		"TesvarKVR"
#define TESVAR_KVR_NODE		"tesvar_kvr"

/* An accepted record: never written again once published. */
struct tesvar_kvr_record {
	refcount_t ref;
	struct rcu_head rcu;
	u64 seq;		/* records accepted up to this one */
	u8 digest[TESVAR_KVR_PARAMS_HASH_SIZE];
	u8 params[TESVAR_KVR_BATTERY_PARAMS_SIZE];
};

struct tesvar_kvr {
	struct miscdevice misc;
	struct crypto_shash *sha1;
	/* Serialises the calls; readers never take it. */
	struct mutex upload_lock;
	/* The kept record, or NULL before the first; replaced under the lock. */
	struct tesvar_kvr_record __rcu *record;
};

/* What an open file of the node refers to. */
struct tesvar_kvr_file {
	struct tesvar_kvr *kvr;
	struct tesvar_kvr_record *record;	/* what it reads, or NULL */
};

/* The node's name is the driver's: one device at a time may have it. */
static unsigned long tesvar_kvr_bound;

static struct platform_device *tesvar_kvr_pdev;

/* The misc core keeps the miscdevice as the drvdata of its device. */
static struct tesvar_kvr *dev_to_kvr(struct device *dev)
{
	struct miscdevice *misc = dev_get_drvdata(dev);

	return container_of(misc, struct tesvar_kvr, misc);
}

/* A reference to the kept record, or NULL when there is none yet. */
static struct tesvar_kvr_record *tesvar_kvr_get_record(struct tesvar_kvr *kvr)
{
	struct tesvar_kvr_record *rec;

	rcu_read_lock();
	/*
	 * The kept reference is dropped only after the record is replaced:
	 * one found unreferenced is already replaced, so look again.
	 */
	do {
		rec = rcu_dereference(kvr->record);
	} while (rec && !refcount_inc_not_zero(&rec->ref));
	rcu_read_unlock();
	return rec;
}

static void tesvar_kvr_put_record(struct tesvar_kvr_record *rec)
{
	/* A reader may still be looking at it: freed after a grace period. */
	if (rec && refcount_dec_and_test(&rec->ref))
		kvfree_rcu(rec, rcu);
}

static ssize_t rc_params_hash_show(struct device *dev,
				   struct device_attribute *attr, char *buf)
{
	struct tesvar_kvr *kvr = dev_to_kvr(dev);
	struct tesvar_kvr_record *rec;
	ssize_t ret;

	rcu_read_lock();
	rec = rcu_dereference(kvr->record);
	if (rec)
		ret = sysfs_emit(buf, "%*phN\n", TESVAR_KVR_PARAMS_HASH_SIZE,
				 rec->digest);
	else
		ret = -ENODATA;
	rcu_read_unlock();
	return ret;
}
static DEVICE_ATTR_RO(rc_params_hash);

static ssize_t uploads_show(struct device *dev, struct device_attribute *attr,
			    char *buf)
{
	struct tesvar_kvr *kvr = dev_to_kvr(dev);
	struct tesvar_kvr_record *rec;
	u64 uploads;

	rcu_read_lock();
	rec = rcu_dereference(kvr->record);
	uploads = rec ? rec->seq : 0;
	rcu_read_unlock();
	return sysfs_emit(buf, "%llu\n", uploads);
}
static DEVICE_ATTR_RO(uploads);

static struct attribute *battery_model_attrs[] = {
	&dev_attr_rc_params_hash.attr,
	&dev_attr_uploads.attr,
	NULL
};

static const struct attribute_group battery_model_group = {
	.name = "battery_model",
	.attrs = battery_model_attrs,
};

static const struct attribute_group *tesvar_kvr_groups[] = {
	&battery_model_group,
	NULL
};

static int tesvar_kvr_set_battery_params(struct tesvar_kvr *kvr,
					 struct file *file,
					 const struct tesvar_kvr_call *call)
{
	struct tesvar_kvr_record *rec, *old;
	int ret;

	if (call->input_size != TESVAR_KVR_BATTERY_PARAMS_SIZE)
		return -EINVAL;

	/* The caller learns of a failure from ENOMEM: no trace in the log. */
	rec = kvmalloc(sizeof(*rec), GFP_KERNEL | __GFP_NOWARN);
	if (!rec)
		return -ENOMEM;

	if (file->f_flags & O_NONBLOCK) {
		if (!mutex_trylock(&kvr->upload_lock)) {
			ret = -EBUSY;
			goto out_free;
		}
	} else if (mutex_lock_killable(&kvr->upload_lock)) {
		ret = -EINTR;
		goto out_free;
	}

	if (copy_from_user(rec->params, u64_to_user_ptr(call->input),
			   sizeof(rec->params))) {
		ret = -EFAULT;
		goto out_unlock;
	}
	ret = crypto_shash_tfm_digest(kvr->sha1, rec->params,
				      sizeof(rec->params), rec->digest);
	if (ret)
		goto out_unlock;

	/* A device driver would write the record to the gauge here. */
	old = rcu_dereference_protected(kvr->record,
					lockdep_is_held(&kvr->upload_lock));
	rec->seq = old ? old->seq + 1 : 1;
	refcount_set(&rec->ref, 1);
	rcu_assign_pointer(kvr->record, rec);
	mutex_unlock(&kvr->upload_lock);
	/* The replaced record lives on for as long as a file reads it. */
	tesvar_kvr_put_record(old);
	return 0;

out_unlock:
	mutex_unlock(&kvr->upload_lock);
out_free:
	kvfree(rec);
	return ret;
}

static int tesvar_kvr_open(struct inode *inode, struct file *file)
{
	/* misc_open() left the miscdevice here. */
	struct tesvar_kvr *kvr = container_of(file->private_data,
					      struct tesvar_kvr, misc);
	struct tesvar_kvr_file *kf;

	kf = kzalloc(sizeof(*kf), GFP_KERNEL);
	if (!kf)
		return -ENOMEM;
	kf->kvr = kvr;
	/* The record it reads is the one kept now, whatever comes later. */
	if (file->f_mode & FMODE_READ)
		kf->record = tesvar_kvr_get_record(kvr);
	file->private_data = kf;
	return nonseekable_open(inode, file);
}

static int tesvar_kvr_release(struct inode *inode, struct file *file)
{
	struct tesvar_kvr_file *kf = file->private_data;

	tesvar_kvr_put_record(kf->record);
	kfree(kf);
	return 0;
}

/* Empty when no record was kept at open. */
static ssize_t tesvar_kvr_read(struct file *file, char __user *buf,
			       size_t count, loff_t *ppos)
{
	struct tesvar_kvr_file *kf = file->private_data;

	if (!kf->record)
		return 0;
	return simple_read_from_buffer(buf, count, ppos, kf->record->params,
				       sizeof(kf->record->params));
}

static long tesvar_kvr_ioctl(struct file *file, unsigned int cmd,
			     unsigned long arg)
{
	struct tesvar_kvr_file *kf = file->private_data;
	struct tesvar_kvr_call call;

	if (cmd != TESVAR_KVR_IOC_CALL_STRUCT)
		return -ENOTTY;
	if (!(file->f_mode & FMODE_WRITE))
		return -EPERM;
	if (copy_from_user(&call, (void __user *)arg, sizeof(call)))
		return -EFAULT;

	switch (call.selector) {
	case TESVAR_KVR_SET_BATTERY_PARAMS:
		return tesvar_kvr_set_battery_params(kf->kvr, file, &call);
	default:
		return -EOPNOTSUPP;
	}
}

static const struct file_operations tesvar_kvr_fops = {
	.owner = THIS_MODULE,
	.open = tesvar_kvr_open,
	.release = tesvar_kvr_release,
	.read = tesvar_kvr_read,
	.unlocked_ioctl = tesvar_kvr_ioctl,
	.compat_ioctl = compat_ptr_ioctl,
	/* No llseek: nonseekable_open() makes every seek fail with ESPIPE. */
};

static void tesvar_kvr_free_sha1(void *data)
{
	crypto_free_shash(data);
}

static void tesvar_kvr_free_record(void *data)
{
	struct tesvar_kvr *kvr = data;

	tesvar_kvr_put_record(rcu_dereference_protected(kvr->record, true));
}

static void tesvar_kvr_deregister(void *data)
{
	misc_deregister(data);
}

static void tesvar_kvr_unbind(void *data)
{
	clear_bit(0, &tesvar_kvr_bound);
}

static int tesvar_kvr_probe(struct platform_device *pdev)
{
	struct device *dev = &pdev->dev;
	struct tesvar_kvr *kvr;
	int ret;

	/*
	 * Another device given this driver (driver_override) is refused
	 * before anything is created: its node would have the same name.
	 */
	if (test_and_set_bit(0, &tesvar_kvr_bound))
		return dev_err_probe(dev, -EBUSY, "%s belongs to another device\n",
				     TESVAR_KVR_NODE);
	ret = devm_add_action_or_reset(dev, tesvar_kvr_unbind, NULL);
	if (ret)
		return ret;

	kvr = devm_kzalloc(dev, sizeof(*kvr), GFP_KERNEL);
	if (!kvr)
		return -ENOMEM;
	mutex_init(&kvr->upload_lock);

	kvr->sha1 = crypto_alloc_shash("sha1", 0, 0);
	if (IS_ERR(kvr->sha1))
		return dev_err_probe(dev, PTR_ERR(kvr->sha1),
				     "no sha1 transform\n");
	ret = devm_add_action_or_reset(dev, tesvar_kvr_free_sha1, kvr->sha1);
	if (ret)
		return ret;
	/* Runs after the node is gone, so no caller still holds the record. */
	ret = devm_add_action_or_reset(dev, tesvar_kvr_free_record, kvr);
	if (ret)
		return ret;

	kvr->misc.minor = MISC_DYNAMIC_MINOR;
	kvr->misc.name = TESVAR_KVR_NODE;
	kvr->misc.fops = &tesvar_kvr_fops;
	kvr->misc.parent = dev;
	kvr->misc.mode = 0600;
	kvr->misc.groups = tesvar_kvr_groups;
	ret = misc_register(&kvr->misc);
	if (ret)
		return dev_err_probe(dev, ret, "cannot register %s\n",
				     TESVAR_KVR_NODE);
	return devm_add_action_or_reset(dev, tesvar_kvr_deregister, &kvr->misc);
}

static struct platform_driver tesvar_kvr_driver = {
	.probe = tesvar_kvr_probe,
	.driver = {
		.name = TESVAR_KVR_NAME,
		/*
		 * An open file keeps the module, not the device: without a
		 * manual unbind the state lives as long as any file on it.
		 */
		.suppress_bind_attrs = true,
	},
};

static int __init tesvar_kvr_init(void)
{
	int ret;

	ret = platform_driver_register(&tesvar_kvr_driver);
	if (ret)
		return ret;

	tesvar_kvr_pdev = platform_device_register_simple(TESVAR_KVR_NAME,
							  PLATFORM_DEVID_NONE,
							  NULL, 0);
	if (IS_ERR(tesvar_kvr_pdev)) {
		platform_driver_unregister(&tesvar_kvr_driver);
		return PTR_ERR(tesvar_kvr_pdev);
	}
	return 0;
}
module_init(tesvar_kvr_init);

static void __exit tesvar_kvr_exit(void)
{
	platform_device_unregister(tesvar_kvr_pdev);
	platform_driver_unregister(&tesvar_kvr_driver);
}
module_exit(tesvar_kvr_exit);

MODULE_SOFTDEP("pre: sha1");
MODULE_DESCRIPTION("Tesvar reference power-management driver (battery model record)");
MODULE_LICENSE("GPL");
