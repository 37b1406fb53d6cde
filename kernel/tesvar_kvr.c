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
 * back (battery_model/battery_params), so that the whole road from a model
 * file to the kernel can be run and checked on any machine.
 *
 * A call is prepared without the lock: the record is copied into a buffer
 * of its own and hashed. Only then is it committed, under the lock, by
 * swapping the buffer in, so a call refused at any step leaves the kept
 * record, its digest and the count exactly as they were, and readers of the
 * attributes always see a record and the digest of that very record.
 */

#include <linux/device.h>
#include <linux/fs.h>
#include <linux/kernel.h>
#include <linux/miscdevice.h>
#include <linux/mm.h>
#include <linux/module.h>
#include <linux/mutex.h>
#include <linux/platform_device.h>
#include <linux/slab.h>
#include <linux/string.h>
#include <linux/sysfs.h>
#include <linux/tesvar_kvr.h>
#include <linux/uaccess.h>
#include <crypto/hash.h>

#include "tesvar_compat.h"

#define TESVAR_KVR_NAME		"TesvarKVR"
#define TESVAR_KVR_NODE		"tesvar_kvr"

struct tesvar_kvr {
	struct miscdevice misc;
	struct crypto_shash *sha1;
	/* Serialises the callers' commits and guards everything below. */
	struct mutex lock;
	void *params;		/* the kept record, or NULL before the first */
	u8 params_hash[TESVAR_KVR_PARAMS_HASH_SIZE];
	u64 uploads;
};

static struct platform_device *tesvar_kvr_pdev;

/* The misc core keeps the miscdevice as the drvdata of its device. */
static struct tesvar_kvr *dev_to_kvr(struct device *dev)
{
	struct miscdevice *misc = dev_get_drvdata(dev);

	return container_of(misc, struct tesvar_kvr, misc);
}

static ssize_t rc_params_hash_show(struct device *dev,
				   struct device_attribute *attr, char *buf)
{
	struct tesvar_kvr *kvr = dev_to_kvr(dev);
	ssize_t ret;

	mutex_lock(&kvr->lock);
	if (kvr->params)
		ret = sysfs_emit(buf, "%*phN\n", TESVAR_KVR_PARAMS_HASH_SIZE,
				 kvr->params_hash);
	else
		ret = -ENODATA;
	mutex_unlock(&kvr->lock);
	return ret;
}
static DEVICE_ATTR_RO(rc_params_hash);

static ssize_t uploads_show(struct device *dev, struct device_attribute *attr,
			    char *buf)
{
	struct tesvar_kvr *kvr = dev_to_kvr(dev);
	u64 uploads;

	mutex_lock(&kvr->lock);
	uploads = kvr->uploads;
	mutex_unlock(&kvr->lock);
	return sysfs_emit(buf, "%llu\n", uploads);
}
static DEVICE_ATTR_RO(uploads);

/*
 * The file's size is left at 0 (no size announced): it is empty until a
 * record is accepted and the whole record afterwards, so the read bounds
 * itself by what is kept.
 */
static ssize_t battery_params_read(struct file *file, struct kobject *kobj,
				   tesvar_bin_attr_const struct bin_attribute *attr,
				   char *buf, loff_t off, size_t count)
{
	struct tesvar_kvr *kvr = dev_to_kvr(kobj_to_dev(kobj));
	ssize_t ret;

	mutex_lock(&kvr->lock);
	ret = memory_read_from_buffer(buf, count, &off, kvr->params,
				      kvr->params ?
				      TESVAR_KVR_BATTERY_PARAMS_SIZE : 0);
	mutex_unlock(&kvr->lock);
	return ret;
}
static BIN_ATTR_ADMIN_RO(battery_params, 0);

static struct attribute *battery_model_attrs[] = {
	&dev_attr_rc_params_hash.attr,
	&dev_attr_uploads.attr,
	NULL
};

static tesvar_bin_attr_const struct bin_attribute *tesvar_bin_attr_const
battery_model_bin_attrs[] = {
	&bin_attr_battery_params,
	NULL
};

static const struct attribute_group battery_model_group = {
	.name = "battery_model",
	.attrs = battery_model_attrs,
	.bin_attrs = battery_model_bin_attrs,
};

static const struct attribute_group *tesvar_kvr_groups[] = {
	&battery_model_group,
	NULL
};

static int tesvar_kvr_set_battery_params(struct tesvar_kvr *kvr,
					 struct file *file,
					 const struct tesvar_kvr_call *call)
{
	u8 digest[TESVAR_KVR_PARAMS_HASH_SIZE];
	void *params;
	int ret;

	if (call->input_size != TESVAR_KVR_BATTERY_PARAMS_SIZE)
		return -EINVAL;

	params = kvmalloc(TESVAR_KVR_BATTERY_PARAMS_SIZE, GFP_KERNEL);
	if (!params)
		return -ENOMEM;
	if (copy_from_user(params, u64_to_user_ptr(call->input),
			   TESVAR_KVR_BATTERY_PARAMS_SIZE)) {
		ret = -EFAULT;
		goto out_free;
	}
	ret = crypto_shash_tfm_digest(kvr->sha1, params,
				      TESVAR_KVR_BATTERY_PARAMS_SIZE, digest);
	if (ret)
		goto out_free;

	if (file->f_flags & O_NONBLOCK) {
		if (!mutex_trylock(&kvr->lock)) {
			ret = -EBUSY;
			goto out_free;
		}
	} else if (mutex_lock_killable(&kvr->lock)) {
		ret = -EINTR;
		goto out_free;
	}
	/* A device driver would write the record to the gauge here. */
	swap(kvr->params, params);
	memcpy(kvr->params_hash, digest, sizeof(digest));
	kvr->uploads++;
	mutex_unlock(&kvr->lock);
	ret = 0;

out_free:
	/* The refused input, or the record the accepted one replaced. */
	kvfree(params);
	return ret;
}

static int tesvar_kvr_open(struct inode *inode, struct file *file)
{
	/* misc_open() left the miscdevice here; the ioctl finds the state. */
	return nonseekable_open(inode, file);
}

static long tesvar_kvr_ioctl(struct file *file, unsigned int cmd,
			     unsigned long arg)
{
	struct tesvar_kvr *kvr = container_of(file->private_data,
					      struct tesvar_kvr, misc);
	struct tesvar_kvr_call call;

	if (cmd != TESVAR_KVR_IOC_CALL_STRUCT)
		return -ENOTTY;
	if (!(file->f_mode & FMODE_WRITE))
		return -EPERM;
	if (copy_from_user(&call, (void __user *)arg, sizeof(call)))
		return -EFAULT;

	switch (call.selector) {
	case TESVAR_KVR_SET_BATTERY_PARAMS:
		return tesvar_kvr_set_battery_params(kvr, file, &call);
	default:
		return -EOPNOTSUPP;
	}
}

static const struct file_operations tesvar_kvr_fops = {
	.owner = THIS_MODULE,
	.open = tesvar_kvr_open,
	.unlocked_ioctl = tesvar_kvr_ioctl,
	.compat_ioctl = compat_ptr_ioctl,
	/* No llseek: nonseekable_open() makes every seek fail with ESPIPE. */
};

static void tesvar_kvr_free_sha1(void *data)
{
	crypto_free_shash(data);
}

static void tesvar_kvr_free_params(void *data)
{
	struct tesvar_kvr *kvr = data;

	kvfree(kvr->params);
}

static void tesvar_kvr_deregister(void *data)
{
	misc_deregister(data);
}

static int tesvar_kvr_probe(struct platform_device *pdev)
{
	struct device *dev = &pdev->dev;
	struct tesvar_kvr *kvr;
	int ret;

	kvr = devm_kzalloc(dev, sizeof(*kvr), GFP_KERNEL);
	if (!kvr)
		return -ENOMEM;
	mutex_init(&kvr->lock);

	kvr->sha1 = crypto_alloc_shash("sha1", 0, 0);
	if (IS_ERR(kvr->sha1))
		return dev_err_probe(dev, PTR_ERR(kvr->sha1),
				     "no sha1 transform\n");
	ret = devm_add_action_or_reset(dev, tesvar_kvr_free_sha1, kvr->sha1);
	if (ret)
		return ret;
	/* Runs after the node is gone, so no caller still holds the record. */
	ret = devm_add_action_or_reset(dev, tesvar_kvr_free_params, kvr);
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
