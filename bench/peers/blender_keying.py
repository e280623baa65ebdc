# Keys one plate with the keying node of Blender's compositor, for the keying
# quality comparison (scripts/key-quality.sh):
#   blender -b --factory-startup --python blender_keying.py -- IN.exr OUT.exr R G B [LOW HIGH]
# The node gets the screen colour R G B, its black and white clips LOW and
# HIGH (default 0 and 1) and its defaults otherwise; OUT.exr holds the keyed
# image with the matte in alpha (float, RGBA).
import sys

import bpy

args = sys.argv[sys.argv.index("--") + 1:]
src, dst, r, g, b = args[:5]
low, high = (args[5], args[6]) if len(args) >= 7 else ("0", "1")
scene = bpy.context.scene
image = bpy.data.images.load(src)
scene.render.resolution_x, scene.render.resolution_y = image.size
scene.render.resolution_percentage = 100
scene.render.image_settings.file_format = "OPEN_EXR"
scene.render.image_settings.color_mode = "RGBA"
scene.render.image_settings.color_depth = "32"
scene.view_settings.view_transform = "Standard"
scene.display_settings.display_device = "None"
scene.sequencer_colorspace_settings.name = "Non-Color"
image.colorspace_settings.name = "Non-Color"
scene.use_nodes = True
tree = scene.node_tree
for node in list(tree.nodes):
    tree.nodes.remove(node)
plate = tree.nodes.new("CompositorNodeImage")
plate.image = image
key = tree.nodes.new("CompositorNodeKeying")
key.inputs["Key Color"].default_value = (float(r), float(g), float(b), 1.0)
key.clip_black, key.clip_white = float(low), float(high)
out = tree.nodes.new("CompositorNodeComposite")
out.use_alpha = True
tree.links.new(plate.outputs["Image"], key.inputs["Image"])
tree.links.new(key.outputs["Image"], out.inputs["Image"])
scene.render.filepath = dst
scene.render.use_compositing = True
scene.render.use_sequencer = False
bpy.ops.render.render(write_still=True)
