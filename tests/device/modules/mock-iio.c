// SPDX-License-Identifier: GPL-2.0
/*
 * IIO converters without hardware: devices "mock-adc0" and on, each with eight voltage channels.
 *
 * Writing in_voltageN_raw sets what the channel converts to. A channel behaves like a converter that
 * samples all the time: each time its value, a threshold or an enable bit is written, every enabled
 * threshold that the value lies beyond raises its event. A buffered scan holds the same values in the
 * format that the module's parameters give. Writing 0 and 1 to the parameter "plugged" takes the
 * converters away and brings them back, whoever has them open.
 */
#include <linux/module.h>
#include <linux/platform_device.h>

#include <linux/iio/buffer.h>
#include <linux/iio/events.h>
#include <linux/iio/iio.h>
#include <linux/iio/trigger_consumer.h>
#include <linux/iio/triggered_buffer.h>

#define CHANNELS 8
#define MAX_DEVICES 2
#define SAMPLE_BYTES 4

static unsigned int devices = 1;
module_param(devices, uint, 0444);
MODULE_PARM_DESC(devices, "how many devices there are (1 or 2)");
static char *endian = "le";
module_param(endian, charp, 0444);
MODULE_PARM_DESC(endian, "byte order of a sample: le or be");
static char *sign = "u";
module_param(sign, charp, 0444);
MODULE_PARM_DESC(sign, "sign of a sample: u or s");
static unsigned int realbits = 12;
module_param(realbits, uint, 0444);
MODULE_PARM_DESC(realbits, "significant bits of a sample");
static unsigned int storagebits = 16;
module_param(storagebits, uint, 0444);
MODULE_PARM_DESC(storagebits, "bits that a sample takes up: 8, 16 or 32");
static unsigned int shift;
module_param(shift, uint, 0444);
MODULE_PARM_DESC(shift, "how far a sample is shifted left");
static unsigned int noise;
module_param(noise, uint, 0444);
MODULE_PARM_DESC(noise, "bits of a sample that carry no value (below and above it) are ones");
static bool either;
module_param(either, bool, 0444);
MODULE_PARM_DESC(either, "one enable bit for both directions");
static bool shared_frequency;
module_param(shared_frequency, bool, 0444);
MODULE_PARM_DESC(shared_frequency, "sampling_frequency in place of in_voltage_sampling_frequency");
static unsigned int scans;
module_param(scans, uint, 0644);
MODULE_PARM_DESC(scans, "how many scans the buffers were given; writing sets the number");
static unsigned int failing_reads;
module_param(failing_reads, uint, 0644);
MODULE_PARM_DESC(failing_reads, "how many of the next reads of a raw value fail, as on a busy bus");

struct mock_channel {
	int value;
	int rising;
	int falling;
	bool rising_on;
	bool falling_on;
};

struct mock_adc {
	struct mutex lock; /* what sysfs and the trigger's thread use */
	struct mock_channel channels[CHANNELS];
	int frequency;
	int period;
	int integration_us;
};

static const char *const names[MAX_DEVICES] = { "mock-adc0", "mock-adc1" };
static struct platform_device *platform;
static struct iio_dev *adcs[MAX_DEVICES];
static struct iio_chan_spec channel_specs[CHANNELS + 1];

static void push_event(struct iio_dev *adc, int channel, enum iio_event_direction dir)
{
	enum iio_event_direction told = either ? IIO_EV_DIR_EITHER : dir;

	iio_push_event(adc, IIO_UNMOD_EVENT_CODE(IIO_VOLTAGE, channel, IIO_EV_TYPE_THRESH, told),
		       iio_get_time_ns(adc));
}

static void compare(struct iio_dev *adc, int number)
{
	struct mock_adc *mock = iio_priv(adc);
	const struct mock_channel *channel = &mock->channels[number];

	if (channel->rising_on && channel->value > channel->rising)
		push_event(adc, number, IIO_EV_DIR_RISING);
	if (channel->falling_on && channel->value < channel->falling)
		push_event(adc, number, IIO_EV_DIR_FALLING);
}

static int read_raw(struct iio_dev *adc, const struct iio_chan_spec *spec, int *val, int *val2,
		    long mask)
{
	struct mock_adc *mock = iio_priv(adc);

	switch (mask) {
	case IIO_CHAN_INFO_RAW:
		if (failing_reads) {
			failing_reads--;
			return -ETIMEDOUT;
		}
		*val = mock->channels[spec->channel].value;
		return IIO_VAL_INT;
	case IIO_CHAN_INFO_SAMP_FREQ:
		*val = mock->frequency;
		return IIO_VAL_INT;
	case IIO_CHAN_INFO_INT_TIME:
		*val = mock->integration_us / USEC_PER_SEC;
		*val2 = mock->integration_us % USEC_PER_SEC;
		return IIO_VAL_INT_PLUS_MICRO;
	default:
		return -EINVAL;
	}
}

static int write_raw(struct iio_dev *adc, const struct iio_chan_spec *spec, int val, int val2,
		     long mask)
{
	struct mock_adc *mock = iio_priv(adc);
	int ret = 0;

	mutex_lock(&mock->lock);
	switch (mask) {
	case IIO_CHAN_INFO_RAW:
		mock->channels[spec->channel].value = val;
		compare(adc, spec->channel);
		break;
	case IIO_CHAN_INFO_SAMP_FREQ:
		mock->frequency = val;
		break;
	case IIO_CHAN_INFO_INT_TIME:
		mock->integration_us = val * USEC_PER_SEC + val2;
		break;
	default:
		ret = -EINVAL;
	}
	mutex_unlock(&mock->lock);
	return ret;
}

static int read_event_config(struct iio_dev *adc, const struct iio_chan_spec *spec,
			     enum iio_event_type type, enum iio_event_direction dir)
{
	struct mock_adc *mock = iio_priv(adc);
	const struct mock_channel *channel = &mock->channels[spec->channel];

	return dir == IIO_EV_DIR_FALLING ? channel->falling_on : channel->rising_on;
}

static int write_event_config(struct iio_dev *adc, const struct iio_chan_spec *spec,
			      enum iio_event_type type, enum iio_event_direction dir, int state)
{
	struct mock_adc *mock = iio_priv(adc);
	struct mock_channel *channel = &mock->channels[spec->channel];

	mutex_lock(&mock->lock);
	if (dir != IIO_EV_DIR_FALLING)
		channel->rising_on = state;
	if (dir != IIO_EV_DIR_RISING)
		channel->falling_on = state;
	compare(adc, spec->channel);
	mutex_unlock(&mock->lock);
	return 0;
}

static int *event_value(struct mock_adc *mock, const struct iio_chan_spec *spec,
			enum iio_event_direction dir, enum iio_event_info info)
{
	if (info == IIO_EV_INFO_PERIOD)
		return &mock->period;
	return dir == IIO_EV_DIR_FALLING ? &mock->channels[spec->channel].falling :
					   &mock->channels[spec->channel].rising;
}

static int read_event_value(struct iio_dev *adc, const struct iio_chan_spec *spec,
			    enum iio_event_type type, enum iio_event_direction dir,
			    enum iio_event_info info, int *val, int *val2)
{
	*val = *event_value(iio_priv(adc), spec, dir, info);
	return IIO_VAL_INT;
}

static int write_event_value(struct iio_dev *adc, const struct iio_chan_spec *spec,
			     enum iio_event_type type, enum iio_event_direction dir,
			     enum iio_event_info info, int val, int val2)
{
	struct mock_adc *mock = iio_priv(adc);

	mutex_lock(&mock->lock);
	*event_value(mock, spec, dir, info) = val;
	if (info == IIO_EV_INFO_VALUE)
		compare(adc, spec->channel);
	mutex_unlock(&mock->lock);
	return 0;
}

static const struct iio_info mock_info = {
	.read_raw = read_raw,
	.write_raw = write_raw,
	.read_event_config = read_event_config,
	.write_event_config = write_event_config,
	.read_event_value = read_event_value,
	.write_event_value = write_event_value,
};

#define THRESH(direction, own, shared)                                                            \
	{                                                                                         \
		.type = IIO_EV_TYPE_THRESH, .dir = (direction), .mask_separate = (own),           \
		.mask_shared_by_type = (shared),                                                  \
	}

static const struct iio_event_spec separate_events[] = {
	THRESH(IIO_EV_DIR_RISING, BIT(IIO_EV_INFO_VALUE) | BIT(IIO_EV_INFO_ENABLE), 0),
	THRESH(IIO_EV_DIR_FALLING, BIT(IIO_EV_INFO_VALUE) | BIT(IIO_EV_INFO_ENABLE), 0),
	THRESH(IIO_EV_DIR_EITHER, 0, BIT(IIO_EV_INFO_PERIOD)),
};

static const struct iio_event_spec either_events[] = {
	THRESH(IIO_EV_DIR_RISING, BIT(IIO_EV_INFO_VALUE), 0),
	THRESH(IIO_EV_DIR_FALLING, BIT(IIO_EV_INFO_VALUE), 0),
	THRESH(IIO_EV_DIR_EITHER, BIT(IIO_EV_INFO_ENABLE), BIT(IIO_EV_INFO_PERIOD)),
};

static u32 sample_of(int value)
{
	u32 mask = realbits < 32 ? BIT(realbits) - 1 : U32_MAX;
	u32 sample = ((u32)value & mask) << shift;

	return noise ? sample | ~(mask << shift) : sample;
}

static void store_sample(u8 *to, u32 sample)
{
	unsigned int bytes = storagebits / 8, i;

	for (i = 0; i < bytes; i++)
		to[endian[0] == 'b' ? bytes - 1 - i : i] = sample >> (8 * i);
}

/* At most one sample at a time is what the tests read, but a scan may hold all eight. */
static irqreturn_t scan(int irq, void *data)
{
	struct iio_poll_func *poll = data;
	struct iio_dev *adc = poll->indio_dev;
	struct mock_adc *mock = iio_priv(adc);
	u8 samples[CHANNELS * SAMPLE_BYTES] __aligned(8) = {};
	unsigned int position = 0;
	int number;

	mutex_lock(&mock->lock);
	for_each_set_bit(number, adc->active_scan_mask, adc->masklength) {
		store_sample(samples + position, sample_of(mock->channels[number].value));
		position += storagebits / 8;
	}
	scans++;
	mutex_unlock(&mock->lock);
	iio_push_to_buffers(adc, samples);
	iio_trigger_notify_done(adc->trig);
	return IRQ_HANDLED;
}

static void describe_channels(void)
{
	struct iio_chan_spec *proximity = &channel_specs[CHANNELS];
	int i;

	for (i = 0; i < CHANNELS; i++) {
		struct iio_chan_spec *spec = &channel_specs[i];

		spec->type = IIO_VOLTAGE;
		spec->indexed = 1;
		spec->channel = i;
		spec->scan_index = i;
		spec->scan_type.sign = sign[0];
		spec->scan_type.realbits = realbits;
		spec->scan_type.storagebits = storagebits;
		spec->scan_type.shift = shift;
		spec->scan_type.endianness = endian[0] == 'b' ? IIO_BE : IIO_LE;
		spec->info_mask_separate = BIT(IIO_CHAN_INFO_RAW);
		if (shared_frequency)
			spec->info_mask_shared_by_all = BIT(IIO_CHAN_INFO_SAMP_FREQ);
		else
			spec->info_mask_shared_by_type = BIT(IIO_CHAN_INFO_SAMP_FREQ);
		spec->event_spec = either ? either_events : separate_events;
		spec->num_event_specs = ARRAY_SIZE(separate_events);
	}
	/* Some converters measure distance as well; their integration time is an attribute of that. */
	proximity->type = IIO_PROXIMITY;
	proximity->scan_index = -1;
	proximity->info_mask_separate = BIT(IIO_CHAN_INFO_INT_TIME);
}

static struct iio_dev *add_adc(unsigned int number)
{
	struct iio_dev *adc = iio_device_alloc(&platform->dev, sizeof(struct mock_adc));
	struct mock_adc *mock;
	int ret;

	if (!adc)
		return ERR_PTR(-ENOMEM);
	mock = iio_priv(adc);
	mutex_init(&mock->lock);
	adc->name = names[number];
	adc->info = &mock_info;
	adc->modes = INDIO_DIRECT_MODE;
	adc->channels = channel_specs;
	adc->num_channels = ARRAY_SIZE(channel_specs);
	ret = iio_triggered_buffer_setup(adc, iio_pollfunc_store_time, scan, NULL);
	if (ret)
		goto no_buffer;
	ret = iio_device_register(adc);
	if (!ret)
		return adc;
	iio_triggered_buffer_cleanup(adc);
no_buffer:
	iio_device_free(adc);
	return ERR_PTR(ret);
}

static void remove_adcs(void)
{
	unsigned int i;

	for (i = 0; i < MAX_DEVICES && adcs[i]; i++) {
		iio_device_unregister(adcs[i]);
		iio_triggered_buffer_cleanup(adcs[i]);
		iio_device_free(adcs[i]);
		adcs[i] = NULL;
	}
}

static int add_adcs(void)
{
	unsigned int i;

	for (i = 0; i < devices; i++) {
		struct iio_dev *adc = add_adc(i);

		if (IS_ERR(adc)) {
			remove_adcs();
			return PTR_ERR(adc);
		}
		adcs[i] = adc;
	}
	return 0;
}

static int plugged_set(const char *text, const struct kernel_param *param)
{
	bool plug;
	int ret = kstrtobool(text, &plug);

	if (ret || !platform)
		return ret ? ret : -ENODEV;
	if (plug == !!adcs[0])
		return 0;
	if (plug)
		return add_adcs();
	remove_adcs();
	return 0;
}

static int plugged_get(char *buffer, const struct kernel_param *param)
{
	return sysfs_emit(buffer, "%d\n", adcs[0] ? 1 : 0);
}

static const struct kernel_param_ops plugged_ops = {
	.set = plugged_set,
	.get = plugged_get,
};
module_param_cb(plugged, &plugged_ops, NULL, 0644);
MODULE_PARM_DESC(plugged, "whether the converters are there");

static bool parameters_make_sense(void)
{
	bool whole = storagebits == 8 || storagebits == 16 || storagebits == 32;

	return devices >= 1 && devices <= MAX_DEVICES && whole && realbits >= 1 &&
	       realbits + shift <= storagebits;
}

static int __init mock_iio_init(void)
{
	int ret;

	if (!parameters_make_sense())
		return -EINVAL;
	platform = platform_device_register_simple("mock-iio", PLATFORM_DEVID_NONE, NULL, 0);
	if (IS_ERR(platform))
		return PTR_ERR(platform);
	describe_channels();
	ret = add_adcs();
	if (ret)
		platform_device_unregister(platform);
	return ret;
}

static void __exit mock_iio_exit(void)
{
	remove_adcs();
	platform_device_unregister(platform);
}

module_init(mock_iio_init);
module_exit(mock_iio_exit);
MODULE_DESCRIPTION("IIO converters without hardware, for tests");
MODULE_LICENSE("GPL");
